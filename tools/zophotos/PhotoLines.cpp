#include "PhotoLines.h"

#include "Text.h"

namespace orva::zophotos {

namespace {

/// A text as a CSV field. Always quoted, so that readers take no name for something else.
std::string Quoted(const std::string& text, bool escapes) {
  std::string field = "\"";
  for (const char byte : escapes ? Printable(text) : ToUtf8(text)) {
    field += byte;
    if (byte == '"') {
      field += byte;
    }
  }
  return field + '"';
}

} // namespace

std::string CsvFields(const Photo& photo, bool escapes) {
  return Quoted(photo.path, escapes) + ',' + Quoted(photo.volume, escapes) + ',' +
         IsoTime(photo.modified).value_or("") + ',' + IsoTime(photo.created).value_or("");
}

void AddMembers(Json& object, const Photo& photo) {
  object["path"] = ToUtf8(photo.path);
  object["volume"] = ToUtf8(photo.volume);
  object["modified"] = JsonTime(photo.modified);
  object["created"] = JsonTime(photo.created);
}

} // namespace orva::zophotos
