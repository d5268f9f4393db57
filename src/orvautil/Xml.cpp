#include "orvautil/Xml.h"

#include <xercesc/dom/DOMNamedNodeMap.hpp>
#include <xercesc/dom/DOMNode.hpp>
#include <xercesc/util/TransService.hpp>

#include <cstddef>

namespace orva::util {

std::string XMLCh2string(const XMLCh* text) {
  if (text == nullptr) {
    return {};
  }
  const xercesc::TranscodeToStr utf8(text, "UTF-8");
  return {reinterpret_cast<const char*>(utf8.str()), static_cast<std::size_t>(utf8.length())};
}

std::string GetAttributeValue(const std::string& name, const xercesc::DOMNamedNodeMap* attributes) {
  if (attributes == nullptr) {
    return {};
  }
  const auto* const bytes = reinterpret_cast<const XMLByte*>(name.data());
  const xercesc::TranscodeFromStr wideName(bytes, name.size(), "UTF-8");
  const xercesc::DOMNode* const attribute = attributes->getNamedItem(wideName.str());
  return attribute == nullptr ? std::string() : XMLCh2string(attribute->getNodeValue());
}

} // namespace orva::util
