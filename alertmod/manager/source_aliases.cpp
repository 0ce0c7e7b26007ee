#include "alertmod/manager/source_aliases.h"

#include "alertmod/manager/event_source_key.h"

namespace hx {

uint32_t SourceAlias::EventKey() const {
  return EventSourceKey(plugin, device, input, context);
}

uint32_t SourceAlias::CameraVideoKey() const {
  return CameraKey(plugin, device, input);
}

std::optional<SourceAlias> SourceAliases::Find(uint32_t analyticsKey) const {
  auto found = m_aliases.find(analyticsKey);
  if (found == m_aliases.end()) return std::nullopt;
  return found->second;
}

SourceAlias SourceAliases::Add(uint32_t analyticsKey, const SourceAlias& alias) {
  // The first word of the host on an analytics input stays in force.
  return m_aliases.emplace(analyticsKey, alias).first->second;
}

uint32_t SourceAliases::Replace(uint32_t key) const {
  auto found = m_aliases.find(key);
  return found == m_aliases.end() ? key : found->second.EventKey();
}

}  // namespace hx
