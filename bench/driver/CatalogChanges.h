#pragma once

#include <ctime>
#include <string>

// What the appliance's indexer does to the catalog of the volume at `mountPoint` between two
// merges, each in one transaction. Failures are thrown as std::string.
namespace orva::bench {

/// The newest stamp of a transcoding.
std::time_t NewestStamp(const std::string& mountPoint);

/// Adds a folder with `files` rendered photos.
void AppendBatch(const std::string& mountPoint, int files);

/// All files are gone from the volume, their transcodings withdrawn.
void DeleteEveryFile(const std::string& mountPoint);

/// All files are there again, their transcodings finished.
void ReviveEveryFile(const std::string& mountPoint);

/// All transcodings are made again.
void RestampEveryFile(const std::string& mountPoint);

} // namespace orva::bench
