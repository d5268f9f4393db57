#pragma once

#include <optional>
#include <string>
#include <vector>

namespace orva::commandline {

/// The one of `names` that a misspelled `word` most likely means; nothing if none is similar.
std::optional<std::string> Suggest(const std::string& word, const std::vector<std::string>& names);

/// "; did you mean 'NAME'?", to be added to a message; empty if no name is similar to `word`.
std::string DidYouMean(const std::string& word, const std::vector<std::string>& names);

} // namespace orva::commandline
