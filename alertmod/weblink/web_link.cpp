#include "alertmod/weblink/web_link.h"

#include <boost/system/system_error.hpp>
#include <exception>
#include <limits>

#include "alertmod/diag/log.h"
#include "alertmod/util/base64.h"
#include "alertmod/weblink/http_get_client.h"
#include "alertmod/weblink/login_reply.h"

namespace hx {
namespace {

constexpr char kLoginPath[] = "/login.web?output=json";
constexpr char kUnreachable[] = "[Web Server Unreachable]";
// Half of the five minutes of recording the link searches, centred on the
// event.
constexpr int64_t kSearchHalfWindowSeconds = 150;

// Seconds as the web front end's milliseconds.
std::string Millis(int64_t seconds) {
  return std::to_string(seconds) + "000";
}

// The front end knows cameras by the signed form of their event source keys.
std::string CameraId(uint32_t key) {
  return std::to_string(static_cast<int32_t>(key));
}

int64_t WindowStart(int64_t eventTime) {
  constexpr int64_t kLowest = std::numeric_limits<int64_t>::min();
  return eventTime < kLowest + kSearchHalfWindowSeconds ? kLowest
                                                        : eventTime - kSearchHalfWindowSeconds;
}

int64_t WindowEnd(int64_t eventTime) {
  constexpr int64_t kHighest = std::numeric_limits<int64_t>::max();
  return eventTime > kHighest - kSearchHalfWindowSeconds ? kHighest
                                                         : eventTime + kSearchHalfWindowSeconds;
}

// The search as a list of camera items, for front ends that report a model.
std::string ItemSearch(const std::string& serverId, int64_t eventTime,
                       const std::vector<uint32_t>& cameraKeys) {
  std::string search = "{\"m\":2,\"sb\":1,\"sm\":1,\"st\":" + Millis(WindowStart(eventTime)) +
                       ",\"et\":" + Millis(WindowEnd(eventTime)) + ",\"items\":[";
  for (size_t n = 0; n < cameraKeys.size(); ++n) {
    if (n > 0) search += ',';
    search += "{\"p\":" + std::to_string(n) + ",\"s\":" + serverId +
              ",\"i\":" + CameraId(cameraKeys[n]) + ",\"t\":\"camera\"}";
  }
  return search + "]}";
}

// The search by server and camera identifiers, for older front ends.
std::string CameraSearch(const std::string& serverId, int64_t eventTime,
                         const std::vector<uint32_t>& cameraKeys) {
  std::string search = "{\"searchServerId\":\"" + serverId + "\",\"searchCameraIds\":[";
  for (size_t n = 0; n < cameraKeys.size(); ++n) {
    if (n > 0) search += ',';
    search += CameraId(cameraKeys[n]);
  }
  return search + "],\"searchStart\":" + Millis(WindowStart(eventTime)) +
         ",\"searchEnd\":" + Millis(WindowEnd(eventTime)) +
         ",\"mode\":\"search\",\"quality\":7,\"size\":100}";
}

// Asks the web server for its systems. Returns false, with the failure
// logged, when the exchange failed.
bool FetchLoginReply(const WebServerAddress& web, const std::string& serial,
                     core::HostCallbackFn callback, std::chrono::milliseconds timeout,
                     LoginReply& login) {
  try {
    HttpGetClient client(web.host, web.port, timeout);
    HttpResponse response;
    client.Get(kLoginPath, response);
    login = ParseLoginReply(response.body, serial);
    return true;
  } catch (const boost::system::system_error& e) {
    LogToHost(core::kModuleId, callback, LogLevelError,
              "Unable to communicate with webserver at address %s. %d: %s", web.address.c_str(),
              e.code().value(), e.what());
  } catch (const std::exception& e) {
    LogToHost(core::kModuleId, callback, LogLevelError,
              "Unable to communicate with webserver at address %s. Error message: %s",
              web.address.c_str(), e.what());
  }
  return false;
}

std::string BuildWebLink(const WebServerAddress& web, const std::string& serial, int64_t eventTime,
                         const std::vector<uint32_t>& cameraKeys, core::HostCallbackFn callback,
                         std::chrono::milliseconds timeout) {
  LoginReply login;
  if (!FetchLoginReply(web, serial, callback, timeout, login)) return kUnreachable;
  if (!login.accepted) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "Incompaitble web server version. No link will be generated");
    return "[Invalid Web Server Version]";
  }
  if (login.serverId.empty()) {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "System with serial %s not found on the web server %s", serial.c_str(),
              web.host.c_str());
    return "[Tamberlux System Not Found]";
  }
  if (cameraKeys.empty()) return "[Connected to Web Server]";
  const std::string search = login.itemForm ? ItemSearch(login.serverId, eventTime, cameraKeys)
                                            : CameraSearch(login.serverId, eventTime, cameraKeys);
  return "http://" + web.address + "/advanced.web?s=" + login.serverId + ";#" +
         Base64Encode(search);
}

}  // namespace

std::string MakeWebLink(const WebServerAddress& web, const std::string& serial, int64_t eventTime,
                        const std::vector<uint32_t>& cameraKeys, core::HostCallbackFn callback,
                        std::chrono::milliseconds timeout) {
  try {
    return BuildWebLink(web, serial, eventTime, cameraKeys, callback, timeout);
  } catch (...) {
    // Only memory exhaustion can get here; the message still goes out.
    return kUnreachable;
  }
}

}  // namespace hx
