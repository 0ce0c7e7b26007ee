// Durable saving and loading of XML files: a save writes a fresh side file
// (the name plus ".pending"), forces it to the storage device and renames it
// over the target; a load adopts a complete side file left by an interrupted
// save. A process-wide guard serialises threads that use the same file name.
//
// Any thread may call these functions; two calls with the same name wait for
// each other, calls with different names run in parallel.
#ifndef ALERTMOD_CONFIG_DURABLE_XML_H_
#define ALERTMOD_CONFIG_DURABLE_XML_H_

#include <string>

#include <tinyxml.h>

#include "alertmod/platform/env.h"

namespace hx {

// Suffix of the side file that a save writes before renaming it.
constexpr const char kPendingSuffix[] = ".pending";

// The printed form of a saved file: four spaces of indentation per level
// and a line feed after every line.
std::string PrintXmlIndented(const TiXmlDocument& document);

// Prints `document` with four-space indentation and LF line ends and stores
// it as `fileName`. False on failure, with the reason in `errorText` when
// given; the target file is never damaged. The texts are "create error N",
// "write error N", "close error N" (N the system error number), "only wrote
// W of S bytes", and "Failed to rename .xml.pending to .xml file N - text",
// which leaves the complete side file for the next load to adopt. The
// document is const, so the reason cannot live in its error description.
// Files are made, renamed and synced through `env`.
bool SaveXmlDurably(platform::Env& env, const TiXmlDocument& document, const std::string& fileName,
                    std::string* errorText = nullptr);

// Reads and parses `fileName`, adopting a complete side file first (one that
// parses and has a root element; it then replaces the target). False when no
// document could be read and parsed.
bool LoadXmlDurably(platform::Env& env, TiXmlDocument& document, const std::string& fileName);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_DURABLE_XML_H_
