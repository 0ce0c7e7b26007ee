#include <cstdint>
#include <string>

#include <tinyxml.h>

#include "alertmod/config/xml_document.h"
#include "alertmod/manager/current_manager.h"
#include "alertmod/manager/notify_manager.h"
#include "tests/support/hooks/hook_registry.h"
#include "tests/support/module_hooks.h"

namespace testhooks {
namespace {

template <typename Apply>
int32_t WithDocument(const char* text, uint32_t length, Apply apply) {
  hx::NotifyManager* manager = hx::CurrentManager();
  if (manager == nullptr || text == nullptr) return -1;
  // Parsed as IOCTL code 2 parses a host document, depth guard included.
  TiXmlDocument document;
  if (!hx::ParseXmlDocument(std::string(text, length), document)) return -1;
  return apply(*manager, document) ? 1 : 0;
}

int32_t ApplyConfigurationUpdate(const char* text, uint32_t length) {
  return WithDocument(text, length, [](hx::NotifyManager& manager, const TiXmlDocument& doc) {
    return manager.ApplyConfigurationUpdate(doc);
  });
}

int32_t ApplySecondReviewer(const char* text, uint32_t length) {
  return WithDocument(text, length, [](hx::NotifyManager& manager, const TiXmlDocument& doc) {
    return manager.ApplySecondReviewer(doc);
  });
}

HookRegistrar g_update("ApplyConfigurationUpdate", AsHook(&ApplyConfigurationUpdate));
HookRegistrar g_reviewer("ApplySecondReviewer", AsHook(&ApplySecondReviewer));

}  // namespace
}  // namespace testhooks
