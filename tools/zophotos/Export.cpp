#include "Commands.h"
#include "MergedDatabase.h"
#include "PhotoLines.h"

namespace orva::zophotos {

ExitStatus ExportFiles(const std::string& path, ExportFormat format, bool escapes) {
  SQLite::Database database = CopyDatabase(path);
  if (format == ExportFormat::Csv) {
    std::cout << CSV_HEADINGS << '\n';
  }
  Walk(database, [format, escapes](const Item& item) {
    if (!item.file) {
      return;
    }
    const Photo photo{.path = item.folder + *item.file,
                      .volume = item.volume,
                      .modified = item.modified,
                      .created = item.created};
    if (format == ExportFormat::Csv) {
      std::cout << CsvFields(photo, escapes) << '\n';
    } else {
      Json line;
      AddMembers(line, photo);
      PrintLine(line);
    }
  });
  return ExitStatus::Success;
}

} // namespace orva::zophotos
