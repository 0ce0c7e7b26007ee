// Durable saving and loading of XML files: a save writes a fresh side file
// (the name plus ".pending"), forces it to the storage device and renames it
// over the target; a load adopts a complete side file left by an interrupted
// save. A process-wide guard serialises threads that use the same file name.
#ifndef ALERTMOD_CONFIG_DURABLE_XML_H_
#define ALERTMOD_CONFIG_DURABLE_XML_H_

#include <string>

#include <tinyxml.h>

namespace hx {

// Prints `document` with four-space indentation and LF line ends and stores
// it as `fileName`. False on failure, with the reason in `errorText` when
// given; the target file is never damaged.
bool SaveXmlDurably(const TiXmlDocument& document, const std::string& fileName,
                    std::string* errorText = nullptr);

// Reads and parses `fileName`, adopting a complete side file first. False
// when no document could be read and parsed.
bool LoadXmlDurably(TiXmlDocument& document, const std::string& fileName);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_DURABLE_XML_H_
