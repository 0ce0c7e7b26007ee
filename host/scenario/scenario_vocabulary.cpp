#include "host/scenario/scenario_vocabulary.h"

#include <utility>

#include "host/system_description.h"

namespace refhost::scenario {
namespace {

struct NamedCode {
  const char* word;
  int32_t code;
};

constexpr NamedCode kEventTypes[] = {
    {"video-loss", 1},
    {"motion", kEventTypeMotion},
    {"input", kEventTypeInput},
    {"pos-port", 4},
    {"pos-profile", 5},
    {"button", 6},
    {"temperature", 7},
    {"storage", 8},
    {"ip-connection", 9},
    {"record-content-age", 10},
    {"archive-content-age", 11},
    {"source-group", kEventTypeSourceGroup},
    {"power-supply", 13},
    {"outbound-connection", 14},
    {"security-integrations-health", 15},
    {"soft-trigger", 16},
    {"license", 17},
    {"analytic", 18},
    {"device-failure", 19},
    {"audio-connection", 20},
    {"device-connection", 21},
    {"throttle", 22},
    {"fan", 23},
    {"time-trigger", 24},
    {"hardware-temperature", 25},
    {"hardware-fan", 26},
    {"hardware-voltage", 27},
    {"archive-connection", 28},
    {"archive-task", 29},
    {"security-integration-connection", 30},
    {"security-integration-alarm", 31},
    {"security-integration-alert", 32},
    {"serial-port-connection", 33},
    {"record-alarm", 34},
    {"thinning", 35},
};

constexpr NamedCode kCodecs[] = {
    {"jpeg", kStandardJpeg}, {"mjpeg", kStandardJpeg}, {"mpeg4", kStandardMpeg4},
    {"h264", kStandardH264}, {"h265", kStandardH265},  {"hevc", kStandardH265},
};

constexpr NamedCode kSecurityModes[] = {{"plain", 0}, {"smtps", 1}, {"starttls", 2}};

constexpr NamedCode kEdges[] = {{"start", 0}, {"end", 1}, {"both", 2}};

// The table of a vocabulary as a range.
std::pair<const NamedCode*, const NamedCode*> Table(Vocabulary vocabulary) {
  switch (vocabulary) {
    case Vocabulary::kEventType:
      return {std::begin(kEventTypes), std::end(kEventTypes)};
    case Vocabulary::kCodec:
      return {std::begin(kCodecs), std::end(kCodecs)};
    case Vocabulary::kSecurity:
      return {std::begin(kSecurityModes), std::end(kSecurityModes)};
    case Vocabulary::kEdge:
      break;
  }
  return {std::begin(kEdges), std::end(kEdges)};
}

}  // namespace

std::optional<int32_t> CodeOf(Vocabulary vocabulary, const std::string& word) {
  const auto [first, last] = Table(vocabulary);
  for (const NamedCode* entry = first; entry != last; ++entry) {
    if (word == entry->word) return entry->code;
  }
  return std::nullopt;
}

std::string WordOf(Vocabulary vocabulary, int32_t code) {
  const auto [first, last] = Table(vocabulary);
  for (const NamedCode* entry = first; entry != last; ++entry) {
    if (entry->code == code) return entry->word;
  }
  return "type " + std::to_string(code);
}

std::string WordsOf(Vocabulary vocabulary) {
  const auto [first, last] = Table(vocabulary);
  std::string words;
  for (const NamedCode* entry = first; entry != last; ++entry) {
    words += (words.empty() ? "" : ", ") + std::string(entry->word);
  }
  return words;
}

}  // namespace refhost::scenario
