#pragma once

#include "VolumeInfo.h"

#include <string>

namespace orva::dbmerger {

// Each source that includes this has its own copies, so that its static initialisers may use them.

/// The locator file, which tells other programs where the merged database is, and its key.
const std::string ZOPHOTODBMERGER_CONFIG_FILE_NAME = "/tmp/zophotodbmerger.conf";
const std::string ZOPHOTOS_DB_PATH = "zophotos_db_path";

const std::string NATIVE_PATH_SEPARATOR = "/";
const std::string OTHER_PATH_SEPARATOR = "\\";

/// File name of the merged database.
const char* const PHOTO_DB_NAME = "zophotos.db";

/// Where the volumes are mounted, and where the merged database is while there is no master.
const std::string SHARES_ROOT = "/shares";

/// The one transcoding profile whose renditions count.
const std::string TRANSCODING_PROFILE = "cb62bbdd389b48898f2e5244977cb2c5";

/// Stands for no volume, and so for no master.
const VolumeInfo EmptyVolumeInfo;

} // namespace orva::dbmerger
