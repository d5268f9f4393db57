#include "orvautil/Xml.h"

#include <xercesc/dom/DOMNamedNodeMap.hpp>
#include <xercesc/dom/DOMNode.hpp>
#include <xercesc/util/TransService.hpp>
#include <xercesc/util/XMLString.hpp>

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace orva::util {

namespace {

constexpr XMLCh ASCII_END = 0x80;

bool IsAscii(std::basic_string_view<XMLCh> text) {
  return std::ranges::all_of(text, [](XMLCh unit) { return unit < ASCII_END; });
}

bool IsAscii(std::string_view text) {
  return std::ranges::all_of(
      text, [](char byte) { return static_cast<unsigned char>(byte) < ASCII_END; });
}

} // namespace

// Nearly all texts are ASCII. They are converted without a transcoder, because making one takes
// longer than parsing a notification.

std::string XMLCh2string(const XMLCh* text) {
  if (text == nullptr) {
    return {};
  }
  const std::basic_string_view<XMLCh> units(text, xercesc::XMLString::stringLen(text));
  if (IsAscii(units)) {
    std::string ascii(units.size(), '\0');
    std::ranges::transform(units, ascii.begin(),
                           [](XMLCh unit) { return static_cast<char>(unit); });
    return ascii;
  }
  const xercesc::TranscodeToStr utf8(text, "UTF-8");
  return {reinterpret_cast<const char*>(utf8.str()), static_cast<std::size_t>(utf8.length())};
}

std::string GetAttributeValue(const std::string& name, const xercesc::DOMNamedNodeMap* attributes) {
  if (attributes == nullptr) {
    return {};
  }
  const xercesc::DOMNode* attribute = nullptr;
  if (IsAscii(name)) {
    const std::basic_string<XMLCh> wideName(name.begin(), name.end());
    attribute = attributes->getNamedItem(wideName.c_str());
  } else {
    const auto* const bytes = reinterpret_cast<const XMLByte*>(name.data());
    const xercesc::TranscodeFromStr wideName(bytes, name.size(), "UTF-8");
    attribute = attributes->getNamedItem(wideName.str());
  }
  return attribute == nullptr ? std::string() : XMLCh2string(attribute->getNodeValue());
}

} // namespace orva::util
