#include "zophotos-web/Selection.h"

#include "Request.h"

#include <array>
#include <cstdio>

namespace orva::web {

std::string MonthText(const Selection& selection) {
  std::array<char, 32> text{};
  if (selection.month) {
    std::snprintf(text.data(), text.size(), "%04d-%02d", selection.year.value_or(0),
                  *selection.month);
  } else if (selection.year) {
    std::snprintf(text.data(), text.size(), "%04d", *selection.year);
  }
  return text.data();
}

std::string Address(const std::string& path, const Selection& selection) {
  std::string address = path;
  if (!selection.words.empty()) {
    address = WithParameter(address, "words", selection.words);
  }
  if (selection.volume) {
    address = WithParameter(address, "volume", *selection.volume);
  }
  if (selection.folder) {
    address = WithParameter(address, "folder", std::to_string(*selection.folder));
  }
  if (selection.year) {
    address = WithParameter(address, "month", MonthText(selection));
  }
  return address;
}

std::string WithParameter(const std::string& address, const std::string& name,
                          const std::string& value) {
  return address + (address.find('?') == std::string::npos ? '?' : '&') + name + '=' +
         PercentEncoded(value);
}

} // namespace orva::web
