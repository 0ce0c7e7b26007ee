// Analytics inputs of the host are event sources of their own, but their
// video comes from a camera input. SourceAliases maps an analytics source key
// to that camera input, and remembers the analytics keys that event
// definitions named before the host said which camera they belong to.
//
// The manager owns one SourceAliases beside the video buffer. Host documents
// fill it and alarm requests read it, on the host threads of Write and IOCTL
// code 2, one at a time; it takes no lock. Entries are never removed.
#ifndef ALERTMOD_MANAGER_SOURCE_ALIASES_H_
#define ALERTMOD_MANAGER_SOURCE_ALIASES_H_

#include <cstdint>
#include <map>
#include <optional>
#include <set>

namespace hx {

// The camera input that supplies an analytics source's video.
struct SourceAlias {
  int32_t plugin = 0;
  int32_t device = 0;
  int32_t input = 0;
  int32_t context = 0;

  // The event source key of the camera input (device and input unmasked).
  uint32_t EventKey() const;
  // The key under which the camera's video is buffered (device and input cut
  // to eight bits each, no context).
  uint32_t CameraVideoKey() const;
};

class SourceAliases {
 public:
  // The alias of `analyticsKey`, or nullopt.
  std::optional<SourceAlias> Find(uint32_t analyticsKey) const;

  // Adds the alias of `analyticsKey` unless it already has one. Returns the
  // alias in force afterwards.
  SourceAlias Add(uint32_t analyticsKey, const SourceAlias& alias);

  // `key` when it has no alias, else the event source key of its alias.
  uint32_t Replace(uint32_t key) const;

  // Remembers an analytics key whose alias is not known yet.
  void MarkUnresolved(uint32_t analyticsKey) { m_unresolved.insert(analyticsKey); }
  // Forgets `analyticsKey` as unresolved. Returns whether it was.
  bool TakeUnresolved(uint32_t analyticsKey) { return m_unresolved.erase(analyticsKey) != 0; }

  const std::map<uint32_t, SourceAlias>& Aliases() const { return m_aliases; }
  const std::set<uint32_t>& Unresolved() const { return m_unresolved; }

 private:
  std::map<uint32_t, SourceAlias> m_aliases;
  std::set<uint32_t> m_unresolved;
};

}  // namespace hx

#endif  // ALERTMOD_MANAGER_SOURCE_ALIASES_H_
