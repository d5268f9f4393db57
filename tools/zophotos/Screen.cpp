#include "Screen.h"

#include "Text.h"

#include <iostream>
#include <sstream>
#include <vector>

namespace orva::zophotos {

void Screen::Show(const std::string& text) {
  std::istringstream stream(text);
  std::vector<std::string> lines;
  for (std::string line; std::getline(stream, line);) {
    lines.push_back(line);
  }
  // The cursor is on a line of its own after the text.
  constexpr std::size_t fewest = 4;
  const std::size_t height = TerminalHeight().value_or(0);
  if (height >= fewest && lines.size() >= height) {
    lines.erase(lines.begin() + static_cast<std::ptrdiff_t>(height) - 3, lines.end() - 1);
    lines.insert(lines.end() - 1, "…");
  }
  if (lines_ != 0) {
    std::cout << "\x1b[" << lines_ << 'A';
  }
  for (const std::string& line : lines) {
    std::cout << line << "\x1b[K\n";
  }
  std::cout << "\x1b[J"; // what is left of a longer text
  lines_ = lines.size();
}

} // namespace orva::zophotos
