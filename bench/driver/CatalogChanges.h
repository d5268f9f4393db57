#pragma once

#include <ctime>
#include <string>

// Changes that the appliance's indexer makes to the catalog of the volume at `mountPoint` between
// two merges. Each function writes in one transaction. Failures are thrown as std::string.
namespace orva::bench {

/// The newest stamp of a transcoding.
std::time_t NewestStamp(const std::string& mountPoint);

/// Adds a folder with `files` rendered photos.
void AppendBatch(const std::string& mountPoint, int files);

/// Marks all files deleted and withdraws their transcodings.
void DeleteEveryFile(const std::string& mountPoint);

/// Reverts DeleteEveryFile: all files exist, their transcodings are finished.
void ReviveEveryFile(const std::string& mountPoint);

/// Gives every transcoding a new stamp, as if it had been made again.
void RestampEveryFile(const std::string& mountPoint);

} // namespace orva::bench
