#include "Indexer.h"

#include "CatalogSchema.h"
#include "VolumeRoot.h"

#include "orvadb/Transaction.h"

#include <iterator>
#include <utility>
#include <vector>

namespace orva::catalog {

Indexer::Indexer(const db::DB& catalog, std::string mountPoint, std::time_t now, Progress progress)
    : catalog_(catalog), mountPoint_(std::move(mountPoint)), now_(now),
      progress_(std::move(progress)) {}

IndexSummary Indexer::Run() {
  const VolumeRoot volume(mountPoint_, VolumeRoot::Kind::Directory);
  db::Transaction transaction(catalog_, BUSY_TIMEOUT);
  FolderIndexer indexer(catalog_, volume, NewPhotos::Finished, now_, {});
  std::vector<IndexedFolder> waiting = {IndexedFolder()};
  while (!waiting.empty()) {
    const IndexedFolder folder = std::move(waiting.back());
    waiting.pop_back();
    std::vector<IndexedFolder> inside = indexer.Update(folder);
    while (!indexer.IsFinished()) {
      inside = indexer.Update(folder);
    }
    if (inside.empty() && progress_) {
      progress_(indexer.Summary());
    }
    // The first one is next.
    waiting.insert(waiting.end(), std::make_move_iterator(inside.rbegin()),
                   std::make_move_iterator(inside.rend()));
  }
  indexer.DeleteUnreachableRows(indexer.Summary().folders, indexer.Summary().rows);
  transaction.Commit();
  return indexer.Summary();
}

} // namespace orva::catalog
