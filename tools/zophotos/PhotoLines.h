#pragma once

#include "Json.h"
#include "Photo.h"

#include <string>

namespace orva::zophotos {

/// The names of the fields of CsvFields.
inline constexpr const char* CSV_HEADINGS = "path,volume,modified,created";

/// A photo as CSV, without a line feed. `escapes`: texts are for people.
std::string CsvFields(const Photo& photo, bool escapes);

/// Adds the members of a photo to an object.
void AddMembers(Json& object, const Photo& photo);

} // namespace orva::zophotos
