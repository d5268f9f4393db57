#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"

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

void PrintCsv(const Item& item, const std::string& path, bool escapes) {
  std::cout << Quoted(path, escapes) << ',' << Quoted(item.volume, escapes) << ','
            << IsoTime(item.modified).value_or("") << ',' << IsoTime(item.created).value_or("")
            << '\n';
}

void PrintJson(const Item& item, const std::string& path) {
  PrintLine({{"path", ToUtf8(path)},
             {"volume", ToUtf8(item.volume)},
             {"modified", JsonTime(item.modified)},
             {"created", JsonTime(item.created)}});
}

} // namespace

ExitStatus ExportFiles(const std::string& path, ExportFormat format, bool escapes) {
  SQLite::Database database = CopyDatabase(path);
  if (format == ExportFormat::Csv) {
    std::cout << "path,volume,modified,created\n";
  }
  Walk(database, [format, escapes](const Item& item) {
    if (!item.file) {
      return;
    }
    if (format == ExportFormat::Csv) {
      PrintCsv(item, item.folder + *item.file, escapes);
    } else {
      PrintJson(item, item.folder + *item.file);
    }
  });
  return ExitStatus::Success;
}

} // namespace orva::zophotos
