#include "zophotos-web/Page.h"

namespace orva::web {

std::string NewestPage(const Site& /*site*/, const PhotoList& /*list*/) {
  return {};
}

std::string SearchPage(const Site& /*site*/, const Selection& /*selection*/,
                       const std::vector<Month>& /*months*/, const PhotoList& /*list*/) {
  return {};
}

std::string FolderPage(const Site& /*site*/, const FolderView& /*view*/) {
  return {};
}

std::string PhotoPage(const Site& /*site*/, const PhotoView& /*view*/) {
  return {};
}

std::string VolumesPage(const Site& /*site*/) {
  return {};
}

std::string ErrorPage(int /*status*/, const std::string& /*text*/) {
  return {};
}

} // namespace orva::web
