#include "StatusFile.h"

#include <nlohmann/json.hpp>

#include <cstdio>
#include <fstream>

namespace orva::indexer {

void WriteStatus(const std::string& directory, const std::vector<VolumeStatus>& volumes) {
  using Json = nlohmann::ordered_json;
  Json list = Json::array();
  for (const VolumeStatus& volume : volumes) {
    list.push_back({{"mountPoint", volume.mountPoint},
                    {"state", volume.state},
                    {"foldersWaiting", volume.foldersWaiting},
                    {"files", volume.files}});
  }
  const std::string path = directory + "/status.json";
  std::ofstream file(path + ".new", std::ios::trunc);
  // Bytes that are not UTF-8 become U+FFFD.
  file << Json{{"volumes", list}}.dump(-1, ' ', false, Json::error_handler_t::replace) << '\n';
  file.close();
  if (file) {
    static_cast<void>(std::rename((path + ".new").c_str(), path.c_str()));
  }
}

} // namespace orva::indexer
