#include "alertmod/config/durable_xml.h"

namespace hx {

bool SaveXmlDurably(const TiXmlDocument&, const std::string&, std::string*) { return false; }

bool LoadXmlDurably(TiXmlDocument&, const std::string&) { return false; }

}  // namespace hx
