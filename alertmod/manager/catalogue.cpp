#include "alertmod/manager/catalogue.h"

#include <tinyxml.h>

#include <algorithm>
#include <cstring>
#include <tuple>

#include "alertmod/config/xml_attr.h"
#include "alertmod/manager/event_source_key.h"

namespace hx {
namespace {

constexpr char kRootName[] = "Trellan";
// An encoder's channels are its inputs encoder * 16 + channel, unless a
// sequence maps them.
constexpr uint32_t kChannelsPerEncoder = 16;

// Calls `visit` for each child element of `parent` named `name`, in order.
template <typename Visit>
void ForEachChild(const TiXmlElement& parent, const char* name, Visit visit) {
  for (const TiXmlElement* child = parent.FirstChildElement(name); child != nullptr;
       child = child->NextSiblingElement(name)) {
    visit(*child);
  }
}

// Calls `visit` for each child element of `parent`, whatever its name.
template <typename Visit>
void ForEachElement(const TiXmlElement& parent, Visit visit) {
  for (const TiXmlElement* child = parent.FirstChildElement(); child != nullptr;
       child = child->NextSiblingElement()) {
    visit(*child);
  }
}

// Calls `visit(sectionId, entry)` for each `entryName` child of each
// `sectionName` child of `trellan` that has an integer "ID".
template <typename Visit>
void ForEachSectionEntry(const TiXmlElement& trellan, const char* sectionName,
                         const char* entryName, Visit visit) {
  ForEachChild(trellan, sectionName, [&](const TiXmlElement& section) {
    const std::optional<int32_t> sectionId = IntAttribute(section, "ID");
    if (sectionId) {
      ForEachChild(section, entryName,
                   [&](const TiXmlElement& entry) { visit(*sectionId, entry); });
    }
  });
}

bool IsNamed(const TiXmlElement& element, const char* name) {
  return std::strcmp(element.Value(), name) == 0;
}

std::string TextOr(const TiXmlElement& element, const char* name) {
  const char* value = element.Attribute(name);
  return value != nullptr ? value : "";
}

// Host documents may carry any numbers; the input of a channel wraps like
// the host's own 32-bit arithmetic instead of overflowing.
int32_t ChannelInput(int32_t encoder, int32_t channel) {
  return static_cast<int32_t>(static_cast<uint32_t>(encoder) * kChannelsPerEncoder +
                              static_cast<uint32_t>(channel));
}

std::map<std::string, std::string> AttributesOf(const TiXmlElement& element) {
  std::map<std::string, std::string> attributes;
  for (const TiXmlAttribute* a = element.FirstAttribute(); a != nullptr; a = a->Next()) {
    attributes[a->Name()] = a->Value();
  }
  return attributes;
}

// The POS/ATM text of a profile's child element: "<profile> - <Value>" for a
// keyword, else the child's own "Name"; nullopt when that attribute is missing.
std::optional<std::string> PosAtmText(const TiXmlElement& child, const char* profileName) {
  if (IsNamed(child, "Keyword")) {
    const char* value = child.Attribute("Value");
    if (value == nullptr) {
      return std::nullopt;
    }
    return std::string(profileName != nullptr ? profileName : "") + " - " + value;
  }
  const char* name = child.Attribute("Name");
  if (name == nullptr) {
    return std::nullopt;
  }
  return std::string(name);
}

}  // namespace

bool SourceIdentity::operator<(const SourceIdentity& other) const {
  return std::tie(kind, plugin, device, context, input) <
         std::tie(other.kind, other.plugin, other.device, other.context, other.input);
}

bool SourceIdentity::operator==(const SourceIdentity& other) const {
  return std::tie(kind, plugin, device, context, input) ==
         std::tie(other.kind, other.plugin, other.device, other.context, other.input);
}

uint32_t SourceKeyOf(const SourceIdentity& identity) {
  return EventSourceKey(identity.plugin, identity.device, identity.input, identity.context);
}

bool EncoderSlot::operator<(const EncoderSlot& other) const {
  return std::tie(kind, plugin, device, encoder, channel, context) <
         std::tie(other.kind, other.plugin, other.device, other.encoder, other.channel,
                  other.context);
}

bool StreamFormatRecord::operator==(const StreamFormatRecord& other) const {
  return std::tie(ID, Number, Width, Height, Standard) ==
         std::tie(other.ID, other.Number, other.Width, other.Height, other.Standard);
}

void HostSystemCatalogue::RebuildCatalogue(const TiXmlElement& trellan) {
  if (!IsNamed(trellan, kRootName) || IntAttributeOr(trellan, "Delta", 0) != 0) {
    return;
  }
  ForEachChild(trellan, "Devices", [&](const TiXmlElement& devices) {
    if (const std::optional<int32_t> plugin = IntAttribute(devices, "ID")) {
      RebuildDevices(devices, *plugin);
    }
  });
  DropUnnamedCameraStreams();
  RebuildPosAtm(trellan);
  RebuildSerial(trellan);
  AddSectionNames(trellan);
}

void HostSystemCatalogue::RebuildDevices(const TiXmlElement& devices, int32_t plugin) {
  DiscardPlugin(plugin);
  const std::string description = TextOr(devices, "Description");
  ForEachChild(devices, "Device", [&](const TiXmlElement& device) {
    const std::optional<int32_t> number = IntAttribute(device, "Number");
    if (!number) {
      return;
    }
    const char* name = device.Attribute("Name");
    const char* serial = device.Attribute("Serial");
    if (name != nullptr && serial != nullptr) {
      SetName({kKindDevice, plugin, *number, 0, 0},
              (description + " " + name + ": " + serial).c_str());
    }
    ForEachChild(device, "Codec", [&](const TiXmlElement& codec) {
      ForEachChild(codec, "Encoder", [&](const TiXmlElement& encoder) {
        AddEncoderStreams(encoder, plugin, *number, 0);
      });
    });
    ForEachChild(device, "Context", [&](const TiXmlElement& context) {
      const std::optional<int32_t> contextNumber = IntAttribute(context, "Number");
      if (!contextNumber) {
        return;
      }
      ForEachChild(context, "Codec", [&](const TiXmlElement& codec) {
        ForEachChild(codec, "Encoder", [&](const TiXmlElement& encoder) {
          AddEncoderStreams(encoder, plugin, *number, *contextNumber);
        });
      });
    });
    AddDeviceInputNames(device, plugin, *number);
  });
}

void HostSystemCatalogue::DiscardPlugin(int32_t plugin) {
  for (auto it = m_streams.begin(); it != m_streams.end();) {
    if (it->second.plugin == plugin) {
      // A stream the document no longer lists keeps no format either, so the
      // video buffer does not hold on to a camera that is gone.
      m_formats.erase(it->first);
      it = m_streams.erase(it);
    } else {
      ++it;
    }
  }
  for (auto it = m_identities.begin(); it != m_identities.end();) {
    it = it->first.plugin == plugin ? m_identities.erase(it) : std::next(it);
  }
  for (auto it = m_names.begin(); it != m_names.end();) {
    it = it->first.plugin == plugin ? m_names.erase(it) : std::next(it);
  }
  // Camera keys carry only the plug-in class bits.
  const uint32_t pluginBits = static_cast<uint32_t>(plugin) & kPluginBitsMask;
  for (auto it = m_cameraStreams.begin(); it != m_cameraStreams.end();) {
    const bool ofPlugin = (static_cast<uint32_t>(it->first) & kPluginBitsMask) == pluginBits;
    it = ofPlugin ? m_cameraStreams.erase(it) : std::next(it);
  }
}

void HostSystemCatalogue::AddEncoderStreams(const TiXmlElement& encoder, int32_t plugin,
                                            int32_t device, int32_t context) {
  const int32_t encoderNumber = IntAttributeOr(encoder, "Number", 0);
  const bool sequenced = encoder.FirstChildElement("Sequence") != nullptr;
  std::vector<int32_t> sequence;
  ForEachChild(encoder, "Sequence", [&](const TiXmlElement& list) {
    ForEachChild(list, "Entry", [&](const TiXmlElement& entry) {
      if (const std::optional<int32_t> input = IntAttribute(entry, "Input")) {
        sequence.push_back(*input);
      }
    });
  });
  ForEachElement(encoder, [&](const TiXmlElement& channel) {
    const bool video = IsNamed(channel, "Channel");
    if (!video && !IsNamed(channel, "AudioChannel")) {
      return;
    }
    const std::optional<int32_t> id = IntAttribute(channel, "ID");
    const std::optional<int32_t> number = IntAttribute(channel, "Number");
    if (!id || !number) {
      return;
    }
    int32_t input = ChannelInput(encoderNumber, *number);
    if (video && sequenced) {
      if (*number < 0 || static_cast<size_t>(*number) >= sequence.size()) {
        return;
      }
      input = sequence[static_cast<size_t>(*number)];
    }
    const int32_t kind = video ? kKindVideoInput : kKindAudioInput;
    const SourceIdentity identity{kind, plugin, device, context, input};
    m_streams[*id] = identity;
    m_identities[EncoderSlot{kind, plugin, device, encoderNumber, *number, context}] = identity;
    if (video) {
      AddChannel(channel, *id, *number, identity);
    }
  });
}

void HostSystemCatalogue::AddChannel(const TiXmlElement& channel, int32_t streamId, int32_t number,
                                     const SourceIdentity& identity) {
  const std::optional<int32_t> width = IntAttribute(channel, "Width");
  const std::optional<int32_t> height = IntAttribute(channel, "Height");
  const std::optional<int32_t> standard = IntAttribute(channel, "Standard");
  if (width && height && standard) {
    m_formats[streamId] = StreamFormatRecord{streamId, number, *width, *height, *standard};
  } else {
    m_formats.erase(streamId);
  }
  if (identity.context >= 1) {
    const uint32_t camera = CameraKey(identity.plugin, identity.device, identity.input);
    m_cameraStreams[static_cast<int32_t>(camera)].push_back(streamId);
  }
}

void HostSystemCatalogue::AddDeviceInputNames(const TiXmlElement& device, int32_t plugin,
                                              int32_t deviceNumber) {
  const auto addInputs = [&](const TiXmlElement& parent, int32_t context) {
    const auto addKind = [&](const char* section, int32_t kind) {
      ForEachChild(parent, section, [&](const TiXmlElement& media) {
        ForEachChild(media, "Input", [&](const TiXmlElement& input) {
          if (const std::optional<int32_t> number = IntAttribute(input, "Number")) {
            SetName({kind, plugin, deviceNumber, context, *number}, input.Attribute("Name"));
          }
        });
      });
    };
    addKind("Video", kKindVideoInput);
    addKind("Audio", kKindAudioInput);
  };
  addInputs(device, 0);
  ForEachChild(device, "Context", [&](const TiXmlElement& context) {
    if (const std::optional<int32_t> number = IntAttribute(context, "Number")) {
      addInputs(context, *number);
    }
  });
  ForEachChild(device, "Trigger", [&](const TiXmlElement& trigger) {
    ForEachElement(trigger, [&](const TiXmlElement& line) {
      const bool input = IsNamed(line, "Input");
      const std::optional<int32_t> number = IntAttribute(line, "Number");
      if ((input || IsNamed(line, "Output")) && number) {
        const int32_t kind = input ? kKindTriggerInput : kKindTriggerOutput;
        SetName({kind, plugin, deviceNumber, 0, *number}, line.Attribute("Name"));
      }
    });
  });
}

void HostSystemCatalogue::DropUnnamedCameraStreams() {
  for (auto list = m_cameraStreams.begin(); list != m_cameraStreams.end();) {
    // A stream stays listed while it is still a named extra stream of this
    // camera; a later channel that reused its identifier takes it away.
    const auto stale = [&](int32_t streamId) {
      const auto stream = m_streams.find(streamId);
      if (stream == m_streams.end()) {
        return true;
      }
      const SourceIdentity& identity = stream->second;
      return identity.kind != kKindVideoInput || identity.context < 1 ||
             static_cast<int32_t>(CameraKey(identity.plugin, identity.device, identity.input)) !=
                 list->first ||
             m_names.count(identity) == 0;
    };
    std::vector<int32_t>& streams = list->second;
    streams.erase(std::remove_if(streams.begin(), streams.end(), stale), streams.end());
    list = streams.empty() ? m_cameraStreams.erase(list) : std::next(list);
  }
}

void HostSystemCatalogue::RebuildPosAtm(const TiXmlElement& trellan) {
  // The keyword table is replaced once per document, so several POS/ATM
  // sections in one document all keep their keywords.
  bool cleared = false;
  ForEachChild(trellan, "POSATM", [&](const TiXmlElement& section) {
    const std::optional<int32_t> sectionId = IntAttribute(section, "ID");
    if (!sectionId) {
      return;
    }
    m_sections.insert(*sectionId);
    if (!cleared && section.FirstChildElement("Profile") != nullptr) {
      m_posAtm.clear();
      cleared = true;
    }
    ForEachChild(section, "Profile", [&](const TiXmlElement& profile) {
      const std::optional<int32_t> profileId = IntAttribute(profile, "ID");
      if (!profileId) {
        return;
      }
      const char* profileName = profile.Attribute("Name");
      SetName({kKindSerialDevice, *sectionId, *profileId, 0, 0}, profileName);
      ForEachElement(profile, [&](const TiXmlElement& child) {
        const std::optional<int32_t> keyword = IntAttribute(child, "ID");
        const std::optional<std::string> text =
            keyword ? PosAtmText(child, profileName) : std::nullopt;
        if (text) {
          SetName({kKindSerialDevice, *sectionId, *profileId, 0, *keyword}, text->c_str());
          m_posAtm[*profileId][*keyword] = *text;
        }
      });
    });
  });
}

void HostSystemCatalogue::RebuildSerial(const TiXmlElement& trellan) {
  m_serialProfiles.clear();
  ForEachChild(trellan, "Serial", [&](const TiXmlElement& section) {
    const std::optional<int32_t> sectionId = IntAttribute(section, "ID");
    if (!sectionId) {
      return;
    }
    m_sections.insert(*sectionId);
    ForEachChild(section, "Input", [&](const TiXmlElement& input) {
      ForEachChild(input, "Device", [&](const TiXmlElement& device) {
        const std::optional<int32_t> deviceId = IntAttribute(device, "ID");
        if (!deviceId) {
          return;
        }
        const SourceIdentity identity{kKindSerialDevice, *sectionId, *deviceId, 0, 0};
        if (const std::optional<int32_t> stream = IntAttribute(device, "StreamID")) {
          m_streams[*stream] = identity;
          if (const std::optional<int32_t> profile = IntAttribute(device, "Profile")) {
            m_serialProfiles[*stream] = *profile;
          }
        }
        if (const std::optional<int32_t> raw = IntAttribute(device, "RawStreamID")) {
          m_streams[*raw] = identity;
        }
        SetName(identity, device.Attribute("Name"));
      });
    });
  });
}

void HostSystemCatalogue::RebuildCases(const TiXmlElement& trellan) {
  m_cases.clear();
  ForEachChild(trellan, "Cases", [&](const TiXmlElement& cases) {
    ForEachChild(cases, "Case", [&](const TiXmlElement& entry) {
      const std::optional<int32_t> id = IntAttribute(entry, "ID");
      if (!id) {
        return;
      }
      CaseRecord record;
      record.attributes = AttributesOf(entry);
      ForEachChild(entry, "Bookmark", [&](const TiXmlElement& bookmark) {
        record.bookmarks.push_back(AttributesOf(bookmark));
      });
      m_cases[*id] = std::move(record);
    });
  });
}

void HostSystemCatalogue::AddSectionNames(const TiXmlElement& trellan) {
  const auto addNumbered = [&](const char* section, int32_t kind) {
    ForEachSectionEntry(trellan, section, "Input", [&](int32_t id, const TiXmlElement& input) {
      if (const std::optional<int32_t> number = IntAttribute(input, "Number")) {
        SetName({kind, id, *number, 0, 0}, input.Attribute("Name"));
      }
    });
  };
  addNumbered("SoftTriggers", kKindSoftTrigger);
  addNumbered("TimeTriggers", kKindTimeTrigger);
  ForEachSectionEntry(trellan, "Events", "SourceGroup", [&](int32_t id, const TiXmlElement& group) {
    if (const std::optional<int32_t> groupId = IntAttribute(group, "ID")) {
      SetName({kKindSourceGroup, id, *groupId, 0, 0}, group.Attribute("Name"));
    }
  });
  RebuildCases(trellan);
  AddConnectionNames(trellan);
  ForEachSectionEntry(trellan, "Serial", "Input", [&](int32_t id, const TiXmlElement& input) {
    ForEachChild(input, "Device", [&](const TiXmlElement& device) {
      if (const std::optional<int32_t> deviceId = IntAttribute(device, "ID")) {
        SetName({kKindDevice, id, *deviceId, 0, 0}, device.Attribute("Name"));
      }
    });
  });
}

void HostSystemCatalogue::AddConnectionNames(const TiXmlElement& trellan) {
  ForEachSectionEntry(
      trellan, "AutoConnections", "AutoConnection", [&](int32_t id, const TiXmlElement& link) {
        const std::optional<int32_t> number = IntAttribute(link, "Number");
        const std::optional<int32_t> port = IntAttribute(link, "Port");
        const char* address = link.Attribute("Address");
        if (number && port && address != nullptr) {
          const std::string name = "Outbound Connection " + std::to_string(*number) + " (" +
                                   address + ":" + std::to_string(*port) + ")";
          SetName({kKindOutboundConnection, id, *number, 0, 0}, name.c_str());
        }
      });
  ForEachChild(trellan, "AccessDevices", [&](const TiXmlElement& section) {
    const std::optional<int32_t> id = IntAttribute(section, "ID");
    const std::string description = TextOr(section, "Description");
    ForEachChild(section, "Device", [&](const TiXmlElement& device) {
      const std::optional<int32_t> number = IntAttribute(device, "Number");
      const char* name = device.Attribute("Name");
      if (id && number && name != nullptr) {
        const std::string text = description + " " + name + ": " + std::to_string(*number);
        SetName({kKindDevice, *id, *number, 0, 0}, text.c_str());
      }
    });
  });
}

void HostSystemCatalogue::SetName(const SourceIdentity& identity, const char* name) {
  if (name != nullptr) {
    m_names[identity] = name;
  }
}

}  // namespace hx
