#pragma once

#include <xercesc/util/PlatformUtils.hpp>

namespace orva::test {

/// The XML platform for as long as the scope lives.
class Platform {
public:
  Platform() { xercesc::XMLPlatformUtils::Initialize(); }
  Platform(const Platform&) = delete;
  Platform& operator=(const Platform&) = delete;
  ~Platform() { xercesc::XMLPlatformUtils::Terminate(); }
};

} // namespace orva::test
