#pragma once

#include <string>

#include <xercesc/util/XercesDefs.hpp>

XERCES_CPP_NAMESPACE_BEGIN
class DOMNamedNodeMap;
XERCES_CPP_NAMESPACE_END

namespace orva::util {

/// The parser's UTF-16 text as UTF-8; null gives the empty string. Throws
/// xercesc::TranscodingException for text that ends inside a surrogate pair.
std::string XMLCh2string(const XMLCh* text);

/// Value of the attribute `name`; empty when it is absent or there are no attributes.
std::string GetAttributeValue(const std::string& name, const xercesc::DOMNamedNodeMap* attributes);

} // namespace orva::util
