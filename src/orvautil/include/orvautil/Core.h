#pragma once

#include "orvautil/Config.h"

#include <string>

namespace orva::core {

/// Address of the appliance's notification socket, as Socket::Address takes it. Each source has its
/// own copy, so that its static initialisers may use it.
const std::string ORVA_NOTIFICATION_SOCKET = ORVA_CONFIG_NOTIFICATION_SOCKET;

/// Folder of the product's own data on the volume at `mountPoint`; does not create it.
std::string GetORVA_HOME(const std::string& mountPoint);

/// Path of the media catalog of the volume at `mountPoint`; does not create it.
std::string GetCatalogPath(const std::string& mountPoint);

} // namespace orva::core
