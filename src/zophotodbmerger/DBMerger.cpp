#include "stdafx.h"

#include "DBMerger.h"

#include "CatalogReader.h"
#include "PhotoDB.h"
#include "SetMerge.h"
#include "Statistics.h"
#include "VolumeInfoManager.h"

#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/thread_timer.h"

namespace orva::dbmerger {

namespace {

using util::thread_timer;

/// Milliseconds that a merge waits for other users of the merged database.
constexpr unsigned MERGE_BUSY_TIMEOUT = 1000;
/// Milliseconds that the reads of a merge wait for the volume's indexer.
constexpr unsigned CATALOG_BUSY_TIMEOUT = 5000;

std::string Elapsed(const thread_timer& timer) {
  return thread_timer::format(timer.Elapsed());
}

std::vector<std::string> RegisteredMountPoints() {
  std::vector<std::string> mountPoints;
  for (const VolumeInfo& volume : VolumeInfoManager::Instance().getVolumes()) {
    mountPoints.push_back(volume.mountPoint);
  }
  return mountPoints;
}

/// The volume's statistics, a new row of zeros when it has none yet.
std::unique_ptr<Statistics> ReadStatistics(PhotoDB& photos, const std::string& volume) {
  auto statistics = photos.GetStatistics(volume);
  if (!statistics) {
    photos.InsertStatistics(volume);
    statistics = photos.GetStatistics(volume);
  }
  if (!statistics) {
    throw "No statistics for " + volume;
  }
  return statistics;
}

/// What a merge stores about a catalog that it has applied.
struct Applied {
  std::time_t newest = 0; ///< time of the newest file applied
  PhotoCounts counts;
};

/// Reads what has changed in the catalog after `since` and applies it, folders before files.
Applied ApplyCatalog(const PhotoDB& photos, const db::VolumeDB& catalog, const std::string& volume,
                     std::time_t since, const std::atomic<bool>& stopRequested) {
  // One view of the catalog for all three reads. It ends before the writing begins, so that the
  // indexer does not have to wait.
  db::Transaction snapshot(catalog, CATALOG_BUSY_TIMEOUT);

  thread_timer timer;
  const MergeList folders = ListFolders(volume, catalog);
  syslog(LOG_LOCAL1 | LOG_INFO, "Retrieved changed folders list for %s in %s\n", volume.c_str(),
         Elapsed(timer).c_str());

  timer.Start();
  const MergeList files = ListChangedFiles(volume, catalog, since);
  syslog(LOG_LOCAL1 | LOG_INFO, "Retrieved %d changed files list for %s in %s\n",
         static_cast<int>(files.Size()), volume.c_str(), Elapsed(timer).c_str());

  timer.Start();
  const PhotoCounts counts = CountPhotos(volume, catalog);
  syslog(LOG_LOCAL1 | LOG_INFO, "Retrieved counts from the orva db for mountPoint %s in %s\n",
         volume.c_str(), Elapsed(timer).c_str());
  snapshot.Commit();

  timer.Start();
  const SetMerge merge(photos, volume, stopRequested);
  merge.ApplyFolders(folders);
  syslog(LOG_LOCAL1 | LOG_INFO, "Merged %d folders for %s in %s\n",
         static_cast<int>(folders.Size()), volume.c_str(), Elapsed(timer).c_str());

  timer.Start();
  const std::time_t newest = merge.ApplyFiles(files, since);
  syslog(LOG_LOCAL1 | LOG_INFO, "Merged %d files for %s in %s\n", static_cast<int>(files.Size()),
         volume.c_str(), Elapsed(timer).c_str());
  return {.newest = newest, .counts = counts};
}

} // namespace

DBMerger::DBMerger() {
  Create(8, 0, false);
  runState_->registryCopied.wait(false);
}

void DBMerger::Run() {
  const std::shared_ptr<RunState> state = runState_;
  const std::vector<std::string> mountPoints = RegisteredMountPoints();
  state->registryCopied = true;
  state->registryCopied.notify_all();
  // From here on the merger may be destroyed.
  for (const std::string& mountPoint : mountPoints) {
    if (state->stopRequested) {
      break;
    }
    syslog(LOG_LOCAL1 | LOG_INFO, "Iterating over mount point %s\n", mountPoint.c_str());
  }
}

void DBMerger::MergeDB(const std::string& masterMountPoint, const std::string& volumeMountPoint) {
  try {
    const std::lock_guard<std::mutex> lock(mergeMutex);
    const db::VolumeDB catalog(volumeMountPoint, false);
    PhotoDB photos(masterMountPoint);
    photos.Init();
    db::Transaction transaction(photos, MERGE_BUSY_TIMEOUT);
    const auto statistics = ReadStatistics(photos, volumeMountPoint);
    const Applied applied = ApplyCatalog(photos, catalog, volumeMountPoint,
                                         statistics->last_updated_time, stopRequested);

    photos.UpdateStatus();
    statistics->last_updated_time = applied.newest;
    statistics->photos_xcoded = applied.counts.transcoded;
    statistics->photos_total = applied.counts.total;
    photos.UpdateStatistics(*statistics);
    transaction.Commit();
  } catch (const std::string& error) {
    syslog(LOG_LOCAL1 | LOG_ERR, "Error that we will ignore %s\n", error.c_str());
  }
}

void DBMerger::ReMergeDB(const std::string& masterMountPoint, const std::string& volumeMountPoint) {
  PhotoDB photos(masterMountPoint);
  photos.Init();
  photos.DeleteVolume(volumeMountPoint);
  MergeDB(masterMountPoint, volumeMountPoint);
}

void DBMerger::RemoveVolume(const std::string& masterMountPoint,
                            const std::string& volumeMountPoint) {
  PhotoDB photos(masterMountPoint);
  photos.Init();
  photos.DeleteVolume(volumeMountPoint);
}

} // namespace orva::dbmerger
