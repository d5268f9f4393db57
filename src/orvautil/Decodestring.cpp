#include "orvautil/Decodestring.h"

#include <charconv>
#include <cstddef>

namespace orva::util {

std::string Decodestring(const std::string& encoded) {
  std::string decoded;
  decoded.reserve(encoded.size());
  for (std::size_t i = 0; i < encoded.size(); ++i) {
    unsigned char byte = 0;
    if (encoded[i] == '%' && encoded.size() - i > 2) {
      const char* const digits = encoded.data() + i + 1;
      const auto [end, error] = std::from_chars(digits, digits + 2, byte, 16);
      if (error == std::errc{} && end == digits + 2 && byte != 0) {
        decoded.push_back(static_cast<char>(byte));
        i += 2;
        continue;
      }
    }
    decoded.push_back(encoded[i]);
  }
  return decoded;
}

} // namespace orva::util
