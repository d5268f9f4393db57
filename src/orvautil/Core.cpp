#include "orvautil/Core.h"

#include "orvautil/Path.h"

namespace orva::core {

std::string GetORVA_HOME(const std::string& mountPoint) {
  return util::MakePath(mountPoint, ORVA_CONFIG_HOME_NAME);
}

std::string GetCatalogPath(const std::string& mountPoint) {
  return util::MakePath(GetORVA_HOME(mountPoint), ORVA_CONFIG_CATALOG_NAME);
}

} // namespace orva::core
