// The reading of the web server's login reply: the JSON document that lists
// the recording systems the web front end knows, from which a link needs this
// system's server identifier.
//
// The reply is read by a character scanner, not a JSON parser: it looks only
// at the keys "id", "model" and "serial" of the objects in the "list" array.
// Pure function; any thread.
#ifndef ALERTMOD_WEBLINK_LOGIN_REPLY_H_
#define ALERTMOD_WEBLINK_LOGIN_REPLY_H_

#include <string>

namespace hx {

struct LoginReply {
  // False when the reply is not one this module understands: too short, no
  // "list" array, an unterminated "id" or "serial" string, or no "serial"
  // string anywhere in the list.
  bool accepted = false;
  // The "id" string of the list entry whose "serial" string equals the wanted
  // serial; empty when there is none or its "id" is not a string.
  std::string serverId;
  // True when a list entry carries a "model" string: the web front end then
  // takes its searches as a list of camera items.
  bool itemForm = false;
};

// Scans `body` for the entry of `serial` (compared byte for byte). Strings
// are skipped whole, so braces inside them do not change the nesting.
LoginReply ParseLoginReply(const std::string& body, const std::string& serial);

}  // namespace hx

#endif  // ALERTMOD_WEBLINK_LOGIN_REPLY_H_
