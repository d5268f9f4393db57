#pragma once

#include <xercesc/util/PlatformUtils.hpp>

namespace orva::test {

/// The XML platform for as long as the scope lives.
class XmlPlatform {
public:
  XmlPlatform() { xercesc::XMLPlatformUtils::Initialize(); }
  XmlPlatform(const XmlPlatform&) = delete;
  XmlPlatform& operator=(const XmlPlatform&) = delete;
  ~XmlPlatform() { xercesc::XMLPlatformUtils::Terminate(); }
};

} // namespace orva::test
