// The words a scenario uses for the host's numeric codes: event types
// ("motion", "storage", ...), stream codecs ("h264", "jpeg", ...), SMTP
// transport security ("plain", "smtps", "starttls") and profile event edges
// ("start", "end", "both").
//
// Pure functions over constant tables; any thread.
#ifndef ALERTMOD_HOST_SCENARIO_SCENARIO_VOCABULARY_H_
#define ALERTMOD_HOST_SCENARIO_SCENARIO_VOCABULARY_H_

#include <cstdint>
#include <optional>
#include <string>

namespace refhost::scenario {

enum class Vocabulary { kEventType, kCodec, kSecurity, kEdge };

// Host event type codes the parser gives alarms by default.
constexpr int32_t kEventTypeMotion = 2;
constexpr int32_t kEventTypeInput = 3;
constexpr int32_t kEventTypeSourceGroup = 12;

// The code of `word`, or nothing when the vocabulary has no such word.
std::optional<int32_t> CodeOf(Vocabulary vocabulary, const std::string& word);

// The word for `code`, or "type <code>" (and the like) when there is none.
std::string WordOf(Vocabulary vocabulary, int32_t code);

// Every word of the vocabulary, separated by ", ", for messages.
std::string WordsOf(Vocabulary vocabulary);

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_SCENARIO_VOCABULARY_H_
