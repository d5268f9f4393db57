#pragma once

#include "Request.h"
#include "zophotos-web/Selection.h"
#include "zophotos-web/SnapshotReader.h"

#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>

namespace orva::web {

/// A parameter of a request has no meaning; what() says which, for the client.
class BadQuery : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

/// The photos that a request asks for. Throws BadQuery.
Selection ParseSelection(const Target& target);

/// The same for the snapshot.
Filter ToFilter(const Selection& selection);

/// The number of a parameter; nothing if it is missing or empty. Throws BadQuery.
std::optional<std::int64_t> ParseId(const Target& target, const std::string& name);

/// How many items a request asks for, 1 to 200; 100 if it does not say. Throws BadQuery.
std::size_t ParseCount(const Target& target);

} // namespace orva::web
