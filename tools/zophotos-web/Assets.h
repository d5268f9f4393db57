#pragma once

#include <string_view>

namespace orva::web {

/// A file that is compiled into the program.
struct Asset {
  std::string_view path; ///< "/style.css"
  std::string_view type; ///< "text/css; charset=utf-8"
  std::string_view etag; ///< of its content, in quotes
  std::string_view content;
};

/// The asset at a path; null if there is none.
const Asset* FindAsset(std::string_view path);

} // namespace orva::web
