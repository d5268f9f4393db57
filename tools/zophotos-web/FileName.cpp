#include "FileName.h"

#include "Request.h"

#include "zophotos/Text.h"

namespace orva::web {
namespace {

bool IsPlainCharacter(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '.' ||
         c == '-' || c == '_';
}

/// For programs that know ASCII only.
std::string AsciiName(std::string_view name) {
  std::string ascii;
  for (const char c : name) {
    ascii += IsPlainCharacter(c) || c == ' ' ? c : '_';
  }
  return ascii;
}

} // namespace

std::string Attachment(std::string_view name) {
  // Escapes of control characters and direction marks become plain names: "a\u202eb" is "a_u202eb".
  std::string printable = zophotos::Printable(zophotos::ToUtf8(name));
  for (char& c : printable) {
    if (c == '\\' || c == '/') {
      c = '_';
    }
  }
  return "attachment; filename=\"" + AsciiName(printable) + "\"; filename*=UTF-8''" +
         PercentEncoded(printable);
}

} // namespace orva::web
