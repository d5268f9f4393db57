#include "Generator.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Classification.h"
#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Transaction.h"

#include "orvautil/FormatString.h"

#include <algorithm>
#include <vector>

namespace orva::catalog {
namespace {

constexpr long long TREE_WIDTH = 8;
constexpr std::time_t FIRST_MODIFIED = 1'500'000'000;

/// Number of the folder that contains folder `number`; -1 for the root of the volume. Folders are
/// numbered from 0, level by level.
long long ParentOf(long long number, Tree tree) {
  return tree == Tree::Flat ? -1 : number / TREE_WIDTH - 1;
}

class Generation {
public:
  Generation(const db::DB& catalog, const GeneratorPlan& plan, std::time_t stamp)
      : catalog_(catalog), plan_(plan), stamp_(stamp) {}

  long long Run() {
    const long long folders = (plan_.files + plan_.perFolder - 1) / plan_.perFolder;
    for (long long number = 0; number < folders; ++number) {
      AddFolder(number);
      const long long first = number * plan_.perFolder;
      const long long count = std::min(plan_.perFolder, plan_.files - first);
      for (long long place = 0; place < count; ++place) {
        AddPhoto(number, first + place, place);
      }
    }
    return folders;
  }

private:
  void AddFolder(long long number) {
    const long long parent = ParentOf(number, plan_.tree);
    db::Folder folder;
    folder.id = number + 1;
    folder.folderId = parent < 0 ? -1 : parent + 1;
    folder.name = util::FormatString("Folder_%07lld", number + 1);
    if (parent >= 0) {
      folder.path = paths_[static_cast<std::size_t>(parent)];
    }
    folder.path += folder.name + '/';
    folder.category = FOLDER;
    folder.lastModifiedDate = FIRST_MODIFIED + number;
    folder.status = INDEXED;
    folder.lastUpdatedDate = stamp_;
    StoreFolder(catalog_, folder);
    paths_.push_back(folder.path);
  }

  /// Adds photo `number` of the catalog, number `place` in its folder; both count from 0.
  void AddPhoto(long long folder, long long number, long long place) {
    db::File file;
    file.id = number + 1;
    file.folderId = folder + 1;
    file.name = plan_.names == Names::Camera ? util::FormatString("IMG_%04lld.JPG", place + 1)
                                             : util::FormatString("Photo_%08lld.jpg", number + 1);
    file.path = paths_[static_cast<std::size_t>(folder)] + file.name;
    file.category = PHOTO;
    file.lastModifiedDate = FIRST_MODIFIED + number;
    file.status = RENDERED;
    file.lastUpdatedDate = stamp_;
    file.ext = "jpg";
    file.size = 1'000'000 + number;
    StoreFile(catalog_, file);
    StoreTranscoding(catalog_, file.id, FINISHED, stamp_);
  }

  const db::DB& catalog_;
  const GeneratorPlan& plan_;
  const std::time_t stamp_;
  std::vector<std::string> paths_; ///< of the folders, indexed by their number
};

} // namespace

long long Generate(const db::DB& catalog, const GeneratorPlan& plan, std::time_t now) {
  db::Transaction transaction(catalog, BUSY_TIMEOUT);
  const std::time_t stamp = NextStamp(catalog, now);
  DropTables(catalog);
  CreateTables(catalog);
  RenewIdentity(catalog);
  const long long folders = Generation(catalog, plan, stamp).Run();
  CreateIndexes(catalog);
  transaction.Commit();
  return folders;
}

long long Restamp(const db::DB& catalog, std::time_t now) {
  db::Transaction transaction(catalog, BUSY_TIMEOUT);
  Execute(catalog, "UPDATE Transcodings SET lastUpdatedDate = ?", NextStamp(catalog, now));
  const long long count = SelectNumber(catalog, "SELECT count(*) FROM Transcodings");
  transaction.Commit();
  return count;
}

} // namespace orva::catalog
