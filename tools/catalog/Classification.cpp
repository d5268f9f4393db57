#include "Classification.h"

#include <algorithm>
#include <array>

namespace orva::catalog {
namespace {

using namespace std::string_view_literals;

constexpr std::array PHOTO_EXTENSIONS = {"arw"sv,  "bmp"sv, "cr2"sv,  "dng"sv, "gif"sv,  "heic"sv,
                                         "heif"sv, "jpe"sv, "jpeg"sv, "jpg"sv, "nef"sv,  "orf"sv,
                                         "png"sv,  "raf"sv, "rw2"sv,  "tif"sv, "tiff"sv, "webp"sv};
constexpr std::array MUSIC_EXTENSIONS = {"aac"sv, "aif"sv, "aiff"sv, "flac"sv, "m4a"sv, "mp3"sv,
                                         "oga"sv, "ogg"sv, "opus"sv, "wav"sv,  "wma"sv};
constexpr std::array VIDEO_EXTENSIONS = {"3gp"sv, "avi"sv,  "m2ts"sv, "m4v"sv, "mkv"sv,  "mov"sv,
                                         "mp4"sv, "mpeg"sv, "mpg"sv,  "mts"sv, "webm"sv, "wmv"sv};

// Files and folders that operating systems create on a volume.
constexpr std::array SYSTEM_NAMES = {
    "$recycle.bin"sv,      ".ds_store"sv,   ".spotlight-v100"sv, ".trashes"sv,
    "albumartsmall.jpg"sv, "desktop.ini"sv, "lost+found"sv,      "system volume information"sv,
    "thumbs.db"sv};

// Some systems store the second half of a file under its name with this prefix.
constexpr std::string_view RESOURCE_PREFIX = "._";

constexpr std::array BACKUP_SUFFIXES = {"~"sv, ".bak"sv};

std::string LowerCase(std::string_view text) {
  std::string result(text);
  std::ranges::transform(result, result.begin(), [](char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  });
  return result;
}

bool Contains(const auto& list, std::string_view name) {
  return std::ranges::find(list, name) != list.end();
}

/// The length of the suffix that marks `name` (in lower case) as a backup; 0 when there is none.
std::size_t BackupSuffix(std::string_view name) {
  const auto* const suffix = std::ranges::find_if(
      BACKUP_SUFFIXES, [name](std::string_view candidate) { return name.ends_with(candidate); });
  return suffix == BACKUP_SUFFIXES.end() ? 0 : suffix->size();
}

} // namespace

Flags FlagsOf(std::string_view name, const Flags& folder) {
  const std::string lower = LowerCase(name);
  return {.isBackup = folder.isBackup || BackupSuffix(lower) != 0,
          .isHidden = folder.isHidden || lower.starts_with('.'),
          .isSystem = folder.isSystem || Contains(SYSTEM_NAMES, lower) ||
                      lower.starts_with(RESOURCE_PREFIX)};
}

std::string ExtensionOf(std::string_view name) {
  std::string lower = LowerCase(name);
  lower.resize(lower.size() - BackupSuffix(lower));
  const std::size_t dot = lower.rfind('.');
  // A leading dot hides the file; it does not start an extension.
  return dot == std::string::npos || dot == 0 ? std::string() : lower.substr(dot + 1);
}

Category CategoryOf(std::string_view extension) {
  if (Contains(PHOTO_EXTENSIONS, extension)) {
    return PHOTO;
  }
  if (Contains(MUSIC_EXTENSIONS, extension)) {
    return MUSIC;
  }
  if (Contains(VIDEO_EXTENSIONS, extension)) {
    return VIDEO;
  }
  return OTHER;
}

} // namespace orva::catalog
