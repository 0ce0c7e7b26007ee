// HostSystemCatalogue is the module's picture of the recording server: which
// devices, inputs, streams, triggers, serial data sources, connections and
// source groups exist, what each is called, and which stream carries which
// camera's video in which format. It is rebuilt from every full host system
// document and answers three kinds of question: what a frame's stream is
// (frame intake), which streams belong to a camera (stream links and video
// capture), and what an event source is called (notification texts).
//
// The NotifyManager owns the one catalogue. It is rebuilt and read only on
// the host threads that deliver Write and IOCTL code 2 calls, which the host
// makes one at a time, so it takes no lock. It never logs.
#ifndef ALERTMOD_MANAGER_CATALOGUE_H_
#define ALERTMOD_MANAGER_CATALOGUE_H_

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

class TiXmlElement;

namespace hx {

// Kinds of source identity.
enum SourceKind : int32_t {
  kKindVideoInput = 0,
  kKindAudioInput = 1,
  kKindSerialDevice = 2,
  kKindSoftTrigger = 3,
  kKindTriggerInput = 4,
  kKindTriggerOutput = 5,
  kKindTimeTrigger = 6,
  kKindSourceGroup = 7,
  kKindDevice = 8,
  kKindOutboundConnection = 9,
};

// What a stream or a name belongs to. Ordered by kind, plug-in, device,
// context, input.
struct SourceIdentity {
  int32_t kind = 0;
  int32_t plugin = 0;
  int32_t device = 0;
  int32_t context = 0;
  int32_t input = 0;

  bool operator<(const SourceIdentity& other) const;
  bool operator==(const SourceIdentity& other) const;
};

// The event source key of an identity.
uint32_t SourceKeyOf(const SourceIdentity& identity);

// Where an encoder stream sits in the host's device tree.
struct EncoderSlot {
  int32_t kind = 0;
  int32_t plugin = 0;
  int32_t device = 0;
  int32_t encoder = 0;
  int32_t channel = 0;
  int32_t context = 0;

  bool operator<(const EncoderSlot& other) const;
};

// The format of one video stream. `Standard` 0 marks a stream of single
// still images; `Number` all bits set marks a stream without a valid number.
struct StreamFormatRecord {
  int32_t ID = 0;
  int32_t Number = -1;
  int32_t Width = 0;
  int32_t Height = 0;
  int32_t Standard = 0;

  bool operator==(const StreamFormatRecord& other) const;
};

// One case of the host, with its bookmarks, kept as the host wrote them.
struct CaseRecord {
  std::map<std::string, std::string> attributes;
  std::vector<std::map<std::string, std::string>> bookmarks;
};

class HostSystemCatalogue {
 public:
  using StreamTable = std::map<int32_t, SourceIdentity>;
  using IdentityIndex = std::map<EncoderSlot, SourceIdentity>;
  using NameTable = std::map<SourceIdentity, std::string>;
  using SectionSet = std::set<int32_t>;
  using CaseTable = std::map<int32_t, CaseRecord>;
  using FormatTable = std::map<int32_t, StreamFormatRecord>;
  using CameraStreamLists = std::map<int32_t, std::vector<int32_t>>;
  using SerialProfileTable = std::map<int32_t, int32_t>;
  using PosAtmTable = std::map<int32_t, std::map<int32_t, std::string>>;

  // Rebuilds the catalogue from a full host system document. Does nothing
  // unless `trellan` is named exactly "Trellan" and its integer "Delta" is 0
  // or missing. The streams, names and camera lists of a plug-in are replaced
  // only when the document lists that plug-in's "Devices" (a stream that is
  // no longer listed loses its format record too); the serial profiles, the
  // cases and, when the document has POS/ATM profiles, the keyword table are
  // rebuilt from every full document. Elements lacking a required integer
  // attribute are skipped with their children. Any element tree gives a
  // defined result.
  void RebuildCatalogue(const TiXmlElement& trellan);

  // The identity of stream `streamId`, or nullopt when the stream is unknown.
  std::optional<SourceIdentity> StreamIdentity(int32_t streamId) const;

  // The event source key of stream `streamId`'s identity; 0 when unknown.
  uint32_t StreamSourceKey(int32_t streamId) const;

  // The format record of stream `streamId`, or nullopt when it has none.
  std::optional<StreamFormatRecord> StreamFormat(int32_t streamId) const;

  // The named extra streams (context 1 and above) of the camera with key
  // `cameraKey` (see CameraKey), in document order; empty when none.
  std::vector<int32_t> CameraStreams(uint32_t cameraKey) const;

  // The first stream, in ascending (signed) stream identifier order, whose
  // identity is a video input and builds `key`; nullopt when none does.
  std::optional<int32_t> FirstVideoStreamOfKey(uint32_t key) const;

  // The name of `identity`: an exact entry of the name table, else the entry
  // of the same identity under each serial and POS/ATM section number in
  // ascending order. nullopt when none has a name.
  std::optional<std::string> LookupName(const SourceIdentity& identity) const;

  // The display name of the event source `key` for host event type `type`:
  // empty for key 0, a fixed text for the device health types, "Unknown" for
  // types without a source, else the catalogue's name of the source (empty
  // when it has none).
  std::string SourceName(uint32_t key, int32_t type) const;

  // The tables, for inspection.
  const StreamTable& Streams() const { return m_streams; }
  const IdentityIndex& Identities() const { return m_identities; }
  const NameTable& Names() const { return m_names; }
  const SectionSet& Sections() const { return m_sections; }
  const CaseTable& Cases() const { return m_cases; }
  const FormatTable& Formats() const { return m_formats; }
  const CameraStreamLists& CameraLists() const { return m_cameraStreams; }
  const SerialProfileTable& SerialProfiles() const { return m_serialProfiles; }
  const PosAtmTable& PosAtmKeywords() const { return m_posAtm; }

 private:
  // The steps of RebuildCatalogue.
  void RebuildDevices(const TiXmlElement& devices, int32_t plugin);
  void DiscardPlugin(int32_t plugin);
  void AddEncoderStreams(const TiXmlElement& encoder, int32_t plugin, int32_t device,
                         int32_t context);
  void AddChannel(const TiXmlElement& channel, int32_t streamId, int32_t number,
                  const SourceIdentity& identity);
  void AddDeviceInputNames(const TiXmlElement& device, int32_t plugin, int32_t deviceNumber);
  void DropUnnamedCameraStreams();
  void RebuildPosAtm(const TiXmlElement& trellan);
  void RebuildSerial(const TiXmlElement& trellan);
  void RebuildCases(const TiXmlElement& trellan);
  void AddSectionNames(const TiXmlElement& trellan);
  void AddConnectionNames(const TiXmlElement& trellan);
  void SetName(const SourceIdentity& identity, const char* name);

  std::string NameOf(const SourceIdentity& identity) const;
  std::string SerialSourceName(int32_t plugin, int32_t device, int32_t input) const;
  std::string StreamNameAt(const EncoderSlot& slot) const;

  StreamTable m_streams;
  IdentityIndex m_identities;
  NameTable m_names;
  SectionSet m_sections;
  CaseTable m_cases;
  FormatTable m_formats;
  CameraStreamLists m_cameraStreams;
  SerialProfileTable m_serialProfiles;
  PosAtmTable m_posAtm;
};

}  // namespace hx

#endif  // ALERTMOD_MANAGER_CATALOGUE_H_
