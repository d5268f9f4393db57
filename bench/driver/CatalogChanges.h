#pragma once

#include "Generator.h"

#include <ctime>
#include <string>

// Changes that the appliance's indexer makes to a generated catalog, of the volume at `mountPoint`,
// between two merges. Each function writes in one transaction. Failures are thrown as std::string.
namespace orva::bench {

/// The newest stamp of a transcoding.
std::time_t NewestStamp(const std::string& mountPoint);

/// Adds a folder with `files` rendered photos. Their names are new, or those that the generator
/// gives to the first photos of every folder.
void AppendBatch(const std::string& mountPoint, int files, catalog::Names names);

/// Adds a rendered photo with a new name to the first folder.
void AppendFile(const std::string& mountPoint);

/// Adds a rendered photo cover.jpg to each folder.
void AddCovers(const std::string& mountPoint);

/// Marks all files deleted and withdraws their transcodings.
void DeleteEveryFile(const std::string& mountPoint);

/// Gives every transcoding a new stamp, as if it had been made again.
void RestampEveryFile(const std::string& mountPoint);

} // namespace orva::bench
