#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>

namespace orva::web {

/// HTML that grows. Markup goes in as literals, and everything else is escaped, so that no text of
/// an untrusted source can become markup.
class Html {
public:
  /// Markup.
  template <std::size_t Size>
  Html& operator<<(const char (&literal)[Size]) {
    text_.append(literal, Size - 1);
    return *this;
  }

  /// Neither markup nor a text: a pointer may be meant as either.
  template <typename Pointer>
  requires std::is_same_v<Pointer, const char*> Html& operator<<(const Pointer&) = delete;

  /// A text, for content and for attributes in double quotes. Bytes that are not UTF-8, and
  /// control characters, become U+FFFD.
  Html& operator<<(const std::string& text);

  Html& operator<<(std::int64_t number);
  Html& operator<<(const Html& html);

  const std::string& Text() const { return text_; }

private:
  std::string text_;
};

/// A name of a file, a folder or a volume as a text for people: control characters, invisible
/// characters and bytes that are not UTF-8 are shown as escapes, as `zophotos` shows them.
std::string NameText(std::string_view name);

/// A name as content: isolated, so that its writing direction cannot change the text around it.
Html Name(std::string_view name);

} // namespace orva::web
