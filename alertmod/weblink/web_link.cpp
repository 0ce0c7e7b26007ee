#include "alertmod/weblink/web_link.h"

namespace hx {

std::string MakeWebLink(const WebServerAddress&, const std::string&, int64_t,
                        const std::vector<uint32_t>&, core::HostCallbackFn) {
  return "[Web Server Unreachable]";
}

}  // namespace hx
