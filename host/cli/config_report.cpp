#include "host/cli/config_report.h"

#include <tinyxml.h>

#include <map>
#include <set>

namespace refhost::cli {
namespace {

// The "Notify" element below the document's root, wherever the root is
// named (the module reads it so).
const TiXmlElement* NotifyOf(const TiXmlDocument& document) {
  const TiXmlElement* root = document.RootElement();
  return root != nullptr ? root->FirstChildElement("Notify") : nullptr;
}

std::string Attribute(const TiXmlElement& element, const char* name, const char* fallback = "") {
  const char* value = element.Attribute(name);
  return value != nullptr ? value : fallback;
}

size_t CountChildren(const TiXmlElement& element, const char* name) {
  size_t count = 0;
  for (const TiXmlElement* child = element.FirstChildElement(name); child != nullptr;
       child = child->NextSiblingElement(name)) {
    ++count;
  }
  return count;
}

std::string SecurityName(const std::string& useSsl) {
  if (useSsl == "1") return "SMTPS";
  if (useSsl == "2") return "STARTTLS";
  if (useSsl == "0") return "plain";
  return "security " + useSsl;
}

std::string EdgeName(const std::string& edge) {
  if (edge == "0") return "start";
  if (edge == "1") return "end";
  if (edge == "2") return "both";
  return edge;
}

std::string DescribeServer(const TiXmlElement& smtp) {
  std::string line = "  \"" + Attribute(smtp, "description") + "\" " + Attribute(smtp, "address") +
                     ":" + Attribute(smtp, "port") + ", " + SecurityName(Attribute(smtp, "UseSSL"));
  const TiXmlElement* authentication = smtp.FirstChildElement("Authentication");
  const std::string user =
      authentication != nullptr ? Attribute(*authentication, "username") : std::string();
  return line + (user.empty() ? ", no login" : ", login " + user);
}

std::string DescribeProfile(const TiXmlElement& smtp) {
  return "  " + Attribute(smtp, "ID") + " \"" + Attribute(smtp, "description") + "\": from " +
         Attribute(smtp, "from") + ", " + std::to_string(CountChildren(smtp, "to")) + " to, " +
         std::to_string(CountChildren(smtp, "cc")) + " cc, " +
         std::to_string(CountChildren(smtp, "bcc")) + " bcc; attach " +
         (Attribute(smtp, "attach") == "1" ? "yes" : "no") + ", video " +
         Attribute(smtp, "MaxVideoSeconds", "0") + " s, edge " +
         EdgeName(Attribute(smtp, "EventEdge", "0")) + ", throttle " +
         Attribute(smtp, "ThrottleSeconds", "0") + " s; subject \"" + Attribute(smtp, "subject") +
         "\"";
}

// Each "smtp" child of every element named `section` below `notify`.
template <typename Visit>
void ForEachEntry(const TiXmlElement& notify, const char* section, Visit visit) {
  for (const TiXmlElement* list = notify.FirstChildElement(section); list != nullptr;
       list = list->NextSiblingElement(section)) {
    for (const TiXmlElement* smtp = list->FirstChildElement("smtp"); smtp != nullptr;
         smtp = smtp->NextSiblingElement("smtp")) {
      visit(*smtp);
    }
  }
}

}  // namespace

std::vector<std::string> DescribeConfiguration(const std::string& posted) {
  std::vector<std::string> lines;
  TiXmlDocument document;
  document.Parse(posted.c_str());
  const TiXmlElement* notify = NotifyOf(document);
  if (notify == nullptr) return lines;
  lines.push_back("Limits: retry for " + Attribute(*notify, "MaxRetrySeconds") + " s, at most " +
                  Attribute(*notify, "MaxRetryQueue") + " queued, messages up to " +
                  Attribute(*notify, "EmailSizeLimitMB") + " MB" +
                  (notify->Attribute("SSL") != nullptr ? "; the transfer tool speaks SMTPS" : ""));
  const TiXmlElement* web = notify->FirstChildElement("Web");
  const std::string address = web != nullptr ? Attribute(*web, "address") : std::string();
  lines.push_back("Web server: " + (address.empty() ? std::string("none") : address));
  std::vector<std::string> servers;
  ForEachEntry(*notify, "Servers",
               [&](const TiXmlElement& smtp) { servers.push_back(DescribeServer(smtp)); });
  lines.push_back("SMTP servers: " + std::to_string(servers.size()));
  lines.insert(lines.end(), servers.begin(), servers.end());
  std::vector<std::string> profiles;
  ForEachEntry(*notify, "Profiles",
               [&](const TiXmlElement& smtp) { profiles.push_back(DescribeProfile(smtp)); });
  lines.push_back("Profiles: " + std::to_string(profiles.size()));
  lines.insert(lines.end(), profiles.begin(), profiles.end());
  return lines;
}

std::vector<std::string> DroppedEntries(const std::string& file, const std::string& posted) {
  std::vector<std::string> lines;
  TiXmlDocument fileDocument;
  TiXmlDocument postedDocument;
  fileDocument.Parse(file.c_str());
  postedDocument.Parse(posted.c_str());
  const TiXmlElement* fileNotify = NotifyOf(fileDocument);
  const TiXmlElement* postedNotify = NotifyOf(postedDocument);
  if (fileNotify == nullptr || postedNotify == nullptr) return lines;
  std::multiset<std::string> postedServers;
  ForEachEntry(*postedNotify, "Servers", [&](const TiXmlElement& smtp) {
    postedServers.insert(Attribute(smtp, "description"));
  });
  ForEachEntry(*fileNotify, "Servers", [&](const TiXmlElement& smtp) {
    const auto found = postedServers.find(Attribute(smtp, "description", "(no description)"));
    if (found != postedServers.end()) {
      postedServers.erase(found);
      return;
    }
    lines.push_back("SMTP server \"" + Attribute(smtp, "description", "(no description)") +
                    "\" was left out: it needs description= and address=");
  });
  std::set<std::string> postedProfiles;
  ForEachEntry(*postedNotify, "Profiles",
               [&](const TiXmlElement& smtp) { postedProfiles.insert(Attribute(smtp, "ID")); });
  ForEachEntry(*fileNotify, "Profiles", [&](const TiXmlElement& smtp) {
    const std::string id = Attribute(smtp, "ID", "(none)");
    if (id == "0" || postedProfiles.count(id) != 0) return;
    lines.push_back("profile " + id + " \"" + Attribute(smtp, "description") +
                    "\" was left out: it needs a numeric ID, description=, from=, subject=, a "
                    "first <to> with an address, and at most one <body>");
  });
  return lines;
}

}  // namespace refhost::cli
