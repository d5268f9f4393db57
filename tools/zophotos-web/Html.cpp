#include "zophotos-web/Html.h"

#include "zophotos/Text.h"

namespace orva::web {

namespace {

bool IsControl(char character) {
  return static_cast<unsigned char>(character) < ' ' || character == '\x7f';
}

} // namespace

Html& Html::operator<<(const std::string& text) {
  for (const char character : zophotos::ToUtf8(text)) {
    switch (character) {
    case '&':
      text_ += "&amp;";
      break;
    case '<':
      text_ += "&lt;";
      break;
    case '>':
      text_ += "&gt;";
      break;
    case '"':
      text_ += "&quot;";
      break;
    case '\'':
      text_ += "&#39;";
      break;
    default:
      if (IsControl(character)) {
        text_ += "\uFFFD";
      } else {
        text_ += character;
      }
    }
  }
  return *this;
}

Html& Html::operator<<(std::int64_t number) {
  text_ += std::to_string(number);
  return *this;
}

Html& Html::operator<<(const Html& html) {
  text_ += html.text_;
  return *this;
}

std::string NameText(std::string_view name) {
  return zophotos::Printable(name);
}

Html Name(std::string_view name) {
  Html html;
  html << "<bdi>" << NameText(name) << "</bdi>";
  return html;
}

} // namespace orva::web
