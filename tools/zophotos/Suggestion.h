#pragma once

#include <optional>
#include <string>
#include <vector>

namespace orva::zophotos {

/// The one of `names` that a misspelled `word` most likely means; nothing if none is similar.
std::optional<std::string> Suggest(const std::string& word, const std::vector<std::string>& names);

} // namespace orva::zophotos
