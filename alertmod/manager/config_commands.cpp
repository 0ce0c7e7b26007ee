// Configuration commands: loading "notify.xml" at Open, saving and posting
// the configuration after every change, configuration updates from the host
// and its second reviewer setting. All run on the host threads of Open and
// IOCTL code 2, one at a time.
#include <vector>

#include <tinyxml.h>

#include "alertmod/config/durable_xml.h"
#include "alertmod/config/module_replies.h"
#include "alertmod/config/xml_attr.h"
#include "alertmod/diag/log.h"
#include "alertmod/mail/smtp_probe.h"
#include "alertmod/mail/templates.h"
#include "alertmod/manager/notify_manager.h"
#include "alertmod/platform/env.h"

namespace hx {
namespace {

constexpr char kConfigFileName[] = "notify.xml";
// Where a "notify.xml" that could not be used is kept before the defaults
// are written over it.
constexpr char kRejectedConfigFileName[] = "notify.xml.rejected";

bool SameServer(const SmtpServer& a, const SmtpServer& b) {
  return a.description == b.description && a.address == b.address && a.port == b.port &&
         a.useSsl == b.useSsl && a.username == b.username && a.password == b.password &&
         a.unreadablePassword == b.unreadablePassword;
}

// The lists count as unchanged as soon as one old server has an equal
// counterpart, the first new server with its description.
bool ServersChanged(const std::vector<SmtpServer>& before, const std::vector<SmtpServer>& after) {
  if (before.size() > after.size() || before.empty()) return true;
  for (const SmtpServer& old : before) {
    for (const SmtpServer& server : after) {
      if (server.description != old.description) continue;
      if (SameServer(old, server)) return false;
      break;
    }
  }
  return true;
}

// Profiles whose last delivery result no longer applies after an update, in
// ascending identifier order.
std::vector<int32_t> ProfilesToReset(const NotifyCfg& before, const NotifyCfg& after) {
  bool serversChanged = ServersChanged(before.Servers(), after.Servers());
  std::vector<int32_t> ids;
  for (const auto& entry : after.Profiles()) {
    const NotifyProfile* old = before.FindProfile(entry.first);
    if (serversChanged || old == nullptr || old->from != entry.second.from) {
      ids.push_back(entry.first);
    }
  }
  return ids;
}

void KeepRejectedFile(platform::Env& env, core::HostCallbackFn callback) {
  platform::Status status = env.RenameFile(kConfigFileName, kRejectedConfigFileName);
  if (status.IsNotFound()) return;
  if (status.ok()) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "The unusable %s was kept as %s before a new one is written.", kConfigFileName,
              kRejectedConfigFileName);
    return;
  }
  LogToHost(core::kModuleId, callback, LogLevelError, "Unable to keep the unusable %s as %s: %s",
            kConfigFileName, kRejectedConfigFileName, status.SystemText().c_str());
}

const TiXmlElement* SecondReviewerElement(const TiXmlDocument& document) {
  const TiXmlElement* root = document.FirstChildElement("Trellan");
  const TiXmlElement* users = root != nullptr ? root->FirstChildElement("Users") : nullptr;
  return users != nullptr ? users->FirstChildElement("SecondReviewer") : nullptr;
}

}  // namespace

ConfigServices NotifyManager::MakeConfigServices(core::HostCallbackFn callback) {
  ConfigServices services;
  services.callback = callback;
  services.errorSink = [callback](const std::string& text) {
    LogToHost(core::kModuleId, callback, LogLevelError, "%s", text.c_str());
  };
  services.hasPlaceholders = &HasPlaceholders;
  return services;
}

void NotifyManager::Open() {
  LoadConfig();
  PostConfig();
}

void NotifyManager::LoadConfig() {
  ProbeSmtps(m_config);
  PostModuleDescription(m_callback);
  TiXmlDocument document;
  const bool loaded = LoadXmlDurably(m_env, document, kConfigFileName) &&
                      m_config.Parse(document, m_configServices);
  // A file rejected for a missing "Servers" or "Profiles" still sets the
  // three limits it carries; the worker and the video buffer follow them.
  SetVideoBufferLimit(m_config.EmailSizeLimitBytes());
  PublishConfigSettings(loaded);
  if (loaded) {
    LogToHost(core::kModuleId, m_callback, LogLevelInfo,
              "Loaded configuration from disk successfully");
    return;
  }
  LogToHost(core::kModuleId, m_callback, LogLevelWarning,
            "Either no configuration or an improper configuration was found, continuing with "
            "empty configuration.");
  // PostConfig is about to write the defaults; a file the user may still
  // want must not be lost under them.
  KeepRejectedFile(m_env, m_callback);
}

void NotifyManager::PostConfig() {
  TiXmlDocument document;
  // Without a password the host could not protect, the file is left as it
  // is (the error sink has said so): it may hold that password.
  const bool complete = BuildConfigDocument(document, m_config, m_configServices);
  std::string error;
  if (complete && SaveXmlDurably(m_env, document, kConfigFileName, &error)) {
    m_config.RememberStoredPasswords(document);
  } else if (complete) {
    LogToHost(core::kModuleId, m_callback, LogLevelError,
              "Unable to save the configuration to %s: %s", kConfigFileName, error.c_str());
  }
  RevealPasswords(document, m_configServices);
  PostToHost(m_callback, core::kClassDocument, PrintCompact(document));
}

bool NotifyManager::ApplyConfigurationUpdate(const TiXmlDocument& document) {
  const NotifyCfg previous = m_config;
  if (!m_config.Parse(document, m_configServices)) {
    // An update without "Servers" or "Profiles" is rejected after its three
    // limits were read; they stay, so the worker and the video buffer must
    // hear of them. Nothing is saved, posted or reported, and the messages
    // waiting for a retry stay: their servers have not changed.
    ApplyLimitChanges(previous);
    return false;
  }
  LogToHost(core::kModuleId, m_callback, LogLevelInfo, "Updated configuration successfully");
  PostConfig();
  PublishConfigSettings(true);
  ProfileStatusDocument status;
  for (int32_t id : ProfilesToReset(previous, m_config)) {
    ReportProfileStatus(status, id, kProfileStatusUnknown, m_env.WallSeconds(), m_callback);
  }
  if (previous.EmailSizeLimitMB() != m_config.EmailSizeLimitMB()) {
    SetVideoBufferLimit(m_config.EmailSizeLimitBytes());
  }
  return true;
}

void NotifyManager::ApplyLimitChanges(const NotifyCfg& before) {
  if (before.MaxRetrySeconds() != m_config.MaxRetrySeconds() ||
      before.MaxRetryQueue() != m_config.MaxRetryQueue()) {
    PublishConfigSettings(false);
  }
  if (before.EmailSizeLimitMB() != m_config.EmailSizeLimitMB()) {
    SetVideoBufferLimit(m_config.EmailSizeLimitBytes());
  }
}

bool NotifyManager::ApplySecondReviewer(const TiXmlDocument& document) {
  const TiXmlElement* reviewer = SecondReviewerElement(document);
  if (reviewer == nullptr) return false;
  std::optional<int32_t> enabled = IntAttribute(*reviewer, "Enabled");
  if (!enabled || !m_config.SetAttachmentsDisabled(*enabled != 0)) return false;
  // Turning the mode off does not bring the attach flags back.
  if (m_config.AttachmentsDisabled() && m_config.DisableAllAttachments()) {
    LogToHost(core::kModuleId, m_callback, LogLevelInfo,
              "Disabled all attachments for second reviewer mode.");
  }
  PostConfig();
  return true;
}

void NotifyManager::PublishConfigSettings(bool configurationReplaced) {
  WorkerSettings settings;
  settings.maxRetrySeconds = m_config.MaxRetrySeconds();
  settings.maxRetryQueue = m_config.MaxRetryQueue();
  PublishWorkerSettings(settings, configurationReplaced);
}

void NotifyManager::SetVideoBufferLimit(int64_t bytes) {
  m_videoBuffer.SetMaxBytes(bytes > 0 ? static_cast<uint64_t>(bytes) : 0);
  if (bytes > 0) return;
  // Video is off: the frame intake keeps no frame any more, so the frames
  // held would only reach later notifications as old video, and the host
  // would not get its buffers back. Captures end with what they hold.
  std::vector<int32_t> streamIds;
  m_videoBuffer.StreamIds(&streamIds);
  for (int32_t streamId : streamIds) m_videoBuffer.RemoveStream(streamId);
}

}  // namespace hx
