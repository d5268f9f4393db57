#include "zophotos-web/Json.h"

#include "zophotos/Text.h"

#include <optional>
#include <string_view>

namespace orva::web {
namespace {

using zophotos::ToUtf8;

template <typename Value>
Json OrNull(const std::optional<Value>& value) {
  return value ? Json(*value) : Json();
}

/// The last component of a folder's path.
std::string_view FolderName(std::string_view path) {
  if (path.ends_with('/')) {
    path.remove_suffix(1);
  }
  return path.substr(path.rfind('/') + 1);
}

} // namespace

Json ToJson(const Photo& photo) {
  return {{"id", std::to_string(photo.id)},
          {"name", ToUtf8(photo.name)},
          {"path", ToUtf8(photo.path)},
          {"folder", std::to_string(photo.folder)},
          {"volume", ToUtf8(photo.volume)},
          {"modified", zophotos::JsonTime(photo.modified)},
          {"local_time", zophotos::LocalTime(photo.modified)}};
}

Json ToJson(const Folder& folder) {
  return {{"id", std::to_string(folder.id)},
          {"parent", folder.parent == -1 ? Json() : Json(std::to_string(folder.parent))},
          {"name", ToUtf8(FolderName(folder.path))},
          {"path", ToUtf8(folder.path)},
          {"volume", ToUtf8(folder.volume)},
          {"has_folders", folder.hasFolders},
          {"has_photos", folder.hasPhotos}};
}

Json ToJson(const Volume& volume) {
  return {{"volume", ToUtf8(volume.mountPoint)},
          {"merged", volume.isMerged},
          {"gone", volume.isGone},
          {"transcoded", volume.transcoded},
          {"total", volume.total},
          {"merged_up_to", zophotos::JsonStamp(volume.mergedUpTo)},
          {"local_merged_up_to",
           volume.mergedUpTo == 0 ? Json() : Json(zophotos::LocalTime(volume.mergedUpTo))},
          {"state", OrNull(volume.state)},
          {"folders_waiting", OrNull(volume.foldersWaiting)},
          {"waiting", OrNull(volume.waiting)},
          {"failed", OrNull(volume.failed)},
          {"rendering", volume.isRendering},
          {"activity", volume.activity}};
}

Json ToJson(const Month& month) {
  return {{"year", month.year}, {"month", month.month}};
}

Json ToJson(const SnapshotStatus& status) {
  return {{"state", NameOf(status.state)},
          {"done", status.done},
          {"total", status.total},
          {"reason", ToUtf8(status.reason)}};
}

std::string ToText(const Json& document) {
  return document.dump(-1, ' ', false, Json::error_handler_t::replace) + '\n';
}

} // namespace orva::web
