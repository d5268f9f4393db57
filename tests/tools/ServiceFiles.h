#pragma once

#include <filesystem>
#include <fstream>
#include <string>

// The status files of the services that index and render. The tests write them in their place.
namespace orva::test {

inline const std::string INDEXER_FOLDER = "/run/orva-indexer";
inline const std::string TRANSCODER_FOLDER = "/run/orva-transcoder";

/// Replaces the status file in `folder`, as the services do.
inline void WriteStatus(const std::string& folder, const std::string& text) {
  std::filesystem::create_directories(folder);
  std::ofstream(folder + "/status.new", std::ios::binary) << text;
  std::filesystem::rename(folder + "/status.new", folder + "/status.json");
}

/// A volume in the indexer's file.
inline std::string IndexerVolume(const std::string& mountPoint, const std::string& state,
                                 const std::string& foldersWaiting) {
  return R"({"mountPoint":")" + mountPoint + R"(","state":")" + state + R"(","foldersWaiting":)" +
         foldersWaiting + R"(,"files":7})";
}

/// A volume in the transcoder's file.
inline std::string TranscoderVolume(const std::string& mountPoint, const std::string& waiting,
                                    const std::string& failed, const std::string& rendering) {
  return R"({"mountPoint":")" + mountPoint + R"(","waiting":)" + waiting + R"(,"failed":)" +
         failed + R"(,"rendering":)" + rendering + "}";
}

/// Writes a service's file with these volumes, which are separated by commas.
inline void WriteVolumes(const std::string& folder, const std::string& volumes) {
  WriteStatus(folder, R"({"volumes":[)" + volumes + "]}\n");
}

} // namespace orva::test
