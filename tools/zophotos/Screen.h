#pragma once

#include <cstddef>
#include <string>

namespace orva::zophotos {

/// Shows a text on the terminal and replaces it in its place.
class Screen {
public:
  /// Shows `text` in place of the last one. Its lines are not wider than the terminal. If it has
  /// more lines than fit, some before its last line are left out.
  void Show(const std::string& text);

private:
  std::size_t lines_ = 0; ///< of the last text, above the cursor
};

} // namespace orva::zophotos
