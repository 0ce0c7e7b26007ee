// Rebuilds the host system catalogue from arbitrary bytes parsed as XML, twice
// (the second time over the first, as later full documents do), then asks for
// the name of every source it knows under every event type, and checks the
// promises the frame intake and the stream links rely on.
#include <tinyxml.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "alertmod/config/xml_document.h"
#include "alertmod/manager/catalogue.h"
#include "alertmod/manager/event_source_key.h"

namespace {

constexpr size_t kMaxKeys = 64;
constexpr int32_t kFirstType = -2;
constexpr int32_t kLastType = 37;

void Check(bool condition) {
  if (!condition) __builtin_trap();
}

// Keys of the streams and named sources, plus a few fixed ones.
std::set<uint32_t> KeysOf(const hx::HostSystemCatalogue& catalogue) {
  std::set<uint32_t> keys = {0, 1, 0xFFFFFFFFu, hx::SourceGroupKey(0), hx::SourceGroupKey(255)};
  for (const auto& stream : catalogue.Streams()) {
    if (keys.size() >= kMaxKeys) break;
    keys.insert(static_cast<uint32_t>(stream.first));
    keys.insert(hx::SourceKeyOf(stream.second));
  }
  for (const auto& name : catalogue.Names()) {
    if (keys.size() >= 2 * kMaxKeys) break;
    const hx::SourceIdentity& id = name.first;
    keys.insert(hx::SourceKeyOf(id));
    keys.insert(hx::EventSourceKey(id.plugin, id.input, id.device, 0));
  }
  return keys;
}

void CheckTables(const hx::HostSystemCatalogue& catalogue) {
  // Every format belongs to a known stream and carries its identifier.
  for (const auto& format : catalogue.Formats()) {
    Check(format.first == format.second.ID);
    Check(catalogue.Streams().count(format.first) == 1);
  }
  // Camera lists hold known streams; those still filed as video inputs are
  // named extra streams of that camera. (A serial section may later claim a
  // stream identifier for itself.)
  for (const auto& list : catalogue.CameraLists()) {
    Check(!list.second.empty());
    for (const int32_t streamId : list.second) {
      const std::optional<hx::SourceIdentity> identity = catalogue.StreamIdentity(streamId);
      Check(identity.has_value());
      if (identity->kind == hx::kKindVideoInput) {
        Check(identity->context >= 1 && catalogue.Names().count(*identity) == 1);
        Check(hx::CameraKey(identity->plugin, identity->device, identity->input) ==
              static_cast<uint32_t>(list.first));
      }
    }
  }
}

// The element depth of a tree, walked without recursion.
size_t TreeDepth(const TiXmlNode& top) {
  size_t deepest = 0;
  std::vector<std::pair<const TiXmlElement*, size_t>> open;
  for (const TiXmlElement* root = top.FirstChildElement(); root != nullptr;
       root = root->NextSiblingElement()) {
    open.emplace_back(root, 1);
  }
  while (!open.empty()) {
    const auto [element, depth] = open.back();
    open.pop_back();
    deepest = std::max(deepest, depth);
    for (const TiXmlElement* child = element->FirstChildElement(); child != nullptr;
         child = child->NextSiblingElement()) {
      open.emplace_back(child, depth + 1);
    }
  }
  return deepest;
}

// The nesting guard must never count less than TinyXML builds, also for
// texts that TinyXML gives up on half way.
void CheckNestingGuard(const std::string& text) {
  const std::optional<size_t> walked = hx::XmlNestingDepth(text, hx::kMaxXmlNesting);
  if (!walked || *walked > hx::kMaxXmlNesting) {
    return;
  }
  std::string padded(text.c_str());
  padded.append(8, '\0');
  TiXmlDocument raw;
  raw.Parse(padded.c_str(), nullptr,
            hx::IsValidUtf8(text) ? TIXML_DEFAULT_ENCODING : TIXML_ENCODING_LEGACY);
  Check(TreeDepth(raw) <= *walked);
}

void AskEverything(const hx::HostSystemCatalogue& catalogue) {
  for (const uint32_t key : KeysOf(catalogue)) {
    for (int32_t type = kFirstType; type <= kLastType; ++type) {
      const std::string name = catalogue.SourceName(key, type);
      Check(key != 0 || name.empty());
    }
    const std::optional<int32_t> stream = catalogue.FirstVideoStreamOfKey(key);
    Check(!stream || catalogue.StreamSourceKey(*stream) == key);
    catalogue.CameraStreams(key & hx::kKeyWithoutContextMask);
    catalogue.StreamFormat(static_cast<int32_t>(key));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  if (text.compare(0, 3, "\xEF\xBB\xBF") != 0) {
    CheckNestingGuard(text);
  }
  TiXmlDocument document;
  if (!hx::ParseXmlDocument(text, document) || document.RootElement() == nullptr) {
    return 0;
  }
  const TiXmlElement* root = document.RootElement();
  hx::HostSystemCatalogue catalogue;
  catalogue.RebuildCatalogue(*root);
  catalogue.RebuildCatalogue(*root);
  CheckTables(catalogue);
  AskEverything(catalogue);
  return 0;
}
