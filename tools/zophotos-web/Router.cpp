#include "Router.h"

#include "FileName.h"
#include "Json.h"
#include "Query.h"
#include "zophotos-web/Assets.h"

#include "zophotos/Activity.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace orva::web {
namespace {

constexpr std::size_t PAGE_SIZE = 100; // photos or folders
constexpr std::size_t MOST_SHOWN_VOLUMES = 1'000;
constexpr std::size_t MOST_SHOWN_ANCESTORS = 100;

/// Bytes of the names and paths in one list, which are several times as many in the response. A
/// list with more has fewer items.
constexpr std::size_t MOST_LIST_BYTES = 64 << 10;
constexpr std::string_view API = "/api/";

constexpr int NOT_MODIFIED = 304;
constexpr int BAD_REQUEST = 400;
constexpr int NOT_FOUND = 404;

/// A document whose content changes. No cache may keep it.
Response DataDocument(std::string type, std::string text) {
  return {
      .type = std::move(type), .body = std::move(text), .headers = {{"Cache-Control", "no-store"}}};
}

Response HtmlDocument(std::string text) {
  return DataDocument("text/html; charset=utf-8", std::move(text));
}

Response JsonText(const Json& document) {
  return DataDocument("application/json", ToText(document));
}

Response NoPhoto(const Target& target) {
  return Router::Refuse(NOT_FOUND, target.path, "There is no such photo.");
}

Response NoFolder(const Target& target) {
  return Router::Refuse(NOT_FOUND, target.path, "There is no such folder.");
}

/// A parameter names a folder that does not exist.
struct UnknownFolder {};

/// A response that browsers keep, and use again when the server says that it is current.
std::vector<std::pair<std::string, std::string>> KeptHeaders(std::string_view tag) {
  return {{"ETag", std::string(tag)}, {"Cache-Control", "private, no-cache"}};
}

Response NotModified(std::string_view tag) {
  return {.status = NOT_MODIFIED, .headers = KeptHeaders(tag)};
}

Response ServeAsset(const Asset& asset, const Request& request) {
  if (Matches(request.ifNoneMatch, asset.etag)) {
    return NotModified(asset.etag);
  }
  return {.type = std::string(asset.type),
          .body = std::string(asset.content),
          .headers = KeptHeaders(asset.etag)};
}

/// Removes `prefix` from `text`. Returns whether it was there.
bool Skip(std::string_view& text, std::string_view prefix) {
  if (!text.starts_with(prefix)) {
    return false;
  }
  text.remove_prefix(prefix.size());
  return true;
}

std::size_t BytesOf(const Photo& photo) {
  return photo.path.size() + photo.name.size() + photo.volume.size();
}

std::size_t BytesOf(const Folder& folder) {
  return folder.path.size() + folder.volume.size();
}

std::size_t BytesOf(const VolumeRow& volume) {
  return volume.mountPoint.size();
}

std::size_t BytesOf(const Volume& volume) {
  return volume.mountPoint.size() + volume.activity.size();
}

/// Shortens a list at one end to at most `count` items and MOST_LIST_BYTES, but not to nothing.
/// Each item has `more` bytes in addition. Returns whether the list was longer.
template <typename Item>
bool CutOff(std::vector<Item>& items, std::size_t count, bool atBegin, std::size_t more = 0) {
  std::size_t kept = 0;
  std::size_t bytes = 0;
  while (kept < std::min(count, items.size())) {
    bytes += BytesOf(atBegin ? items[items.size() - 1 - kept] : items[kept]) + more;
    if (kept > 0 && bytes > MOST_LIST_BYTES) {
      break;
    }
    ++kept;
  }
  const bool isLonger = kept < items.size();
  const auto surplus = static_cast<std::ptrdiff_t>(items.size() - kept);
  items.erase(atBegin ? items.begin() : items.end() - surplus,
              atBegin ? items.begin() + surplus : items.end());
  return isLonger;
}

template <typename Item>
Json Array(const std::vector<Item>& items) {
  Json array = Json::array();
  for (const Item& item : items) {
    array.push_back(ToJson(item));
  }
  return array;
}

Json FirstId(const std::vector<Photo>& photos) {
  return photos.empty() ? Json() : Json(std::to_string(photos.front().id));
}

/// The folder whose folders are the top of the tree: the one that contains the volumes. -1, for all
/// folders without a parent, if a crafted database has others.
std::int64_t TopOf(const Readers::Lease& reader) {
  const std::vector<Folder> top = reader->Folders(-1, {}, 2);
  return top.size() == 1 && top.front().path == "/shares/" ? top.front().id : -1;
}

/// The folder that a list of folders continues after, of the parameter `name`. Throws
/// UnknownFolder.
std::optional<Folder> FolderAfter(const Readers::Lease& reader, const Target& target,
                                  const std::string& name) {
  const auto id = ParseId(target, name);
  auto folder = id ? reader->FindFolder(*id) : std::nullopt;
  if (id && !folder) {
    throw UnknownFolder();
  }
  return folder;
}

/// The folders that contain a folder: the nearest ones, from the top.
std::vector<Folder> AncestorsOf(const Readers::Lease& reader, std::int64_t folder) {
  std::vector<Folder> ancestors = reader->Ancestors(folder);
  CutOff(ancestors, MOST_SHOWN_ANCESTORS, true);
  return ancestors;
}

/// The part of the file that the request asks for.
Response ServeFile(VolumeFile file, const Request& request, const std::string& type) {
  Response response{.type = type, .headers = KeptHeaders(file.tag)};
  const bool isRanged =
      !request.range.empty() && (request.ifRange.empty() || request.ifRange == file.tag);
  const auto range = isRanged ? ParseRange(request.range, file.size) : std::nullopt;
  const ByteRange part = range.value_or(ByteRange());
  const std::string size = std::to_string(file.size);
  response.headers.emplace_back("Accept-Ranges", "bytes");
  if (!range) {
    response.body = FilePart{.file = std::move(file.file), .offset = 0, .size = file.size};
  } else if (part.count == 0) {
    response.status = 416;
    response.headers.emplace_back("Content-Range", "bytes */" + size);
  } else {
    response.status = 206;
    response.headers.emplace_back("Content-Range", "bytes " + std::to_string(part.first) + '-' +
                                                       std::to_string(part.first + part.count - 1) +
                                                       '/' + size);
    response.body =
        FilePart{.file = std::move(file.file), .offset = part.first, .size = part.count};
  }
  return response;
}

} // namespace

Response Router::Answer(const Request& request) {
  std::string_view path = request.target.path;
  try {
    if (Skip(path, API)) {
      return AnswerJson(request, path);
    }
    if (const Asset* const asset = FindAsset(path)) {
      return ServeAsset(*asset, request);
    }
    return AnswerPage(request, path);
  } catch (const BadQuery& error) {
    return Refuse(BAD_REQUEST, request.target.path, error.what());
  } catch (const UnknownFolder&) {
    return NoFolder(request.target);
  }
}

Response Router::Refuse(int status, std::string_view path, const std::string& reason) {
  Response response = path.starts_with(API) ? JsonText({{"error", reason}})
                                            : HtmlDocument(ErrorPage(status, reason));
  response.status = status;
  return response;
}

Response Router::AnswerPage(const Request& request, std::string_view path) {
  const Target& target = request.target;
  if (path == "/") {
    return NewestView(target);
  }
  if (path == "/search") {
    return SearchView(target);
  }
  if (path == "/folders") {
    return FoldersView(target, std::nullopt);
  }
  if (path == "/volumes") {
    return HtmlDocument(VolumesPage(MakeSite()));
  }
  if (Skip(path, "/folders/")) {
    const auto id = ParseNumber(path);
    return id ? FoldersView(target, id) : NoFolder(target);
  }
  if (Skip(path, "/photos/")) {
    const std::size_t end = std::min(path.find('/'), path.size());
    const auto id = ParseNumber(path.substr(0, end));
    return id ? AnswerPhoto(request, *id, path.substr(end)) : NoPhoto(target);
  }
  return Refuse(NOT_FOUND, target.path, "There is no such page.");
}

Response Router::AnswerPhoto(const Request& request, PhotoId id, std::string_view rest) {
  if (rest.empty()) {
    return PhotoView(request.target, id);
  }
  if (rest == "/rendition") {
    return Rendition(request, id);
  }
  if (rest == "/original") {
    return Original(request, id);
  }
  return Refuse(NOT_FOUND, request.target.path, "There is no such page.");
}

Response Router::AnswerJson(const Request& request, std::string_view path) {
  const Target& target = request.target;
  if (path == "photos") {
    return PhotosJson(target);
  }
  if (path == "folders") {
    return FoldersJson(target);
  }
  if (path == "months") {
    return MonthsJson(target);
  }
  if (path == "volumes") {
    return VolumesJson();
  }
  if (path == "status") {
    return StatusJson();
  }
  if (path == "events") {
    // A proxy must not wait until it has more.
    return {.type = "text/event-stream",
            .body = EventStream(),
            .headers = {{"Cache-Control", "no-store"}, {"X-Accel-Buffering", "no"}}};
  }
  if (Skip(path, "photos/")) {
    const auto id = ParseNumber(path);
    return id ? PhotoJson(target, *id) : NoPhoto(target);
  }
  if (Skip(path, "folders/")) {
    const auto id = ParseNumber(path);
    return id ? FolderJson(*id) : NoFolder(target);
  }
  return Refuse(NOT_FOUND, target.path, "There is no such resource.");
}

Response Router::NewestView(const Target& target) {
  return HtmlDocument(NewestPage(MakeSite(), MakeList(target, {}, PAGE_SIZE)));
}

Response Router::SearchView(const Target& target) {
  const Selection selection = ParseSelection(target);
  const Filter filter = ToFilter(selection);
  const std::vector<Month> months = Readers::Lease(readers_)->Months({});
  return HtmlDocument(
      SearchPage(MakeSite(), selection, months, MakeList(target, filter, PAGE_SIZE)));
}

Response Router::FoldersView(const Target& target, std::optional<std::int64_t> folder) {
  FolderView view;
  {
    const Readers::Lease reader(readers_);
    if (folder) {
      view.folder = reader->FindFolder(*folder);
      if (!view.folder) {
        return NoFolder(target);
      }
      view.ancestors = AncestorsOf(reader, *folder);
    }
    view.folders = reader->Folders(folder ? *folder : TopOf(reader),
                                   FolderAfter(reader, target, "after_folder"), PAGE_SIZE + 1);
    view.hasMoreFolders = CutOff(view.folders, PAGE_SIZE, false);
  }
  if (folder) {
    view.list =
        MakeList(target, {.folder = folder, .volume = {}, .words = {}, .times = {}}, PAGE_SIZE);
  }
  return HtmlDocument(FolderPage(MakeSite(), view));
}

Response Router::PhotoView(const Target& target, PhotoId id) {
  web::PhotoView view;
  view.selection = ParseSelection(target);
  {
    const Filter filter = ToFilter(view.selection);
    const Readers::Lease reader(readers_);
    auto photo = reader->Find(id);
    if (!photo) {
      return NoPhoto(target);
    }
    view.photo = std::move(*photo);
    const auto newer = reader->PhotosAfter(filter, id, 1);
    const auto older = reader->Photos(filter, id, 1);
    view.newer = newer.empty() ? std::nullopt : std::optional(newer.front().id);
    view.older = older.empty() ? std::nullopt : std::optional(older.front().id);
  }
  return HtmlDocument(PhotoPage(MakeSite(), view));
}

Response Router::Rendition(const Request& request, PhotoId id) {
  const auto photo = Readers::Lease(readers_)->Find(id);
  if (!photo) {
    return NoPhoto(request.target);
  }
  return {.body = DiskWork{.volume = photo->volume,
                           .make = [this, request, photo] { return Rendition(request, *photo); }}};
}

Response Router::Rendition(const Request& request, const Photo& photo) {
  auto file = files_.OpenRendition(photo);
  if (!file) {
    return Refuse(NOT_FOUND, request.target.path, "The rendition of this photo cannot be read.");
  }
  return Matches(request.ifNoneMatch, file->tag)
             ? NotModified(file->tag)
             : Response{.type = "image/jpeg",
                        .body = FilePart{.file = std::move(file->file), .size = file->size},
                        .headers = KeptHeaders(file->tag)};
}

Response Router::Original(const Request& request, PhotoId id) {
  const auto photo = Readers::Lease(readers_)->Find(id);
  if (!photo) {
    return NoPhoto(request.target);
  }
  return {.body = DiskWork{.volume = photo->volume,
                           .make = [this, request, photo] { return Original(request, *photo); }}};
}

Response Router::Original(const Request& request, const Photo& photo) {
  auto file = files_.OpenOriginal(photo);
  if (!file) {
    return Refuse(NOT_FOUND, request.target.path, "This photo cannot be read.");
  }
  if (Matches(request.ifNoneMatch, file->tag)) {
    return NotModified(file->tag);
  }
  // The browser saves it, whatever it is.
  Response response = ServeFile(std::move(*file), request, "application/octet-stream");
  response.headers.emplace_back("Content-Disposition", Attachment(photo.name));
  return response;
}

Response Router::PhotosJson(const Target& target) {
  const PhotoList list = MakeList(target, ToFilter(ParseSelection(target)), ParseCount(target));
  const bool isNewer = ParseId(target, "after").has_value();
  return JsonText(
      {{"photos", Array(list.photos)}, {"more", isNewer ? list.hasNewer : list.hasOlder}});
}

Response Router::PhotoJson(const Target& target, PhotoId id) {
  const Filter filter = ToFilter(ParseSelection(target));
  const Readers::Lease reader(readers_);
  const auto photo = reader->Find(id);
  if (!photo) {
    return NoPhoto(target);
  }
  Json document = ToJson(*photo);
  document["newer"] = FirstId(reader->PhotosAfter(filter, id, 1));
  document["older"] = FirstId(reader->Photos(filter, id, 1));
  return JsonText(document);
}

Response Router::FoldersJson(const Target& target) {
  const std::size_t count = ParseCount(target);
  const Readers::Lease reader(readers_);
  const auto parent = ParseId(target, "parent");
  auto folders = reader->Folders(parent ? *parent : TopOf(reader),
                                 FolderAfter(reader, target, "after"), count + 1);
  const bool more = CutOff(folders, count, false);
  return JsonText({{"folders", Array(folders)}, {"more", more}});
}

Response Router::FolderJson(std::int64_t id) {
  const Readers::Lease reader(readers_);
  const auto folder = reader->FindFolder(id);
  if (!folder) {
    return Refuse(NOT_FOUND, API, "There is no such folder.");
  }
  Json document = ToJson(*folder);
  document["ancestors"] = Array(AncestorsOf(reader, id));
  return JsonText(document);
}

Response Router::MonthsJson(const Target& target) {
  const Filter filter = ToFilter(ParseSelection(target));
  return JsonText({{"months", Array(Readers::Lease(readers_)->Months(filter))}});
}

Response Router::VolumesJson() {
  const Site site = MakeSite();
  return JsonText({{"volumes", Array(site.volumes)}, {"more", site.mayHaveMoreVolumes}});
}

Response Router::StatusJson() {
  Json document = ToJson(snapshot_.Status());
  document["version"] = Readers::Lease(readers_)->Version();
  return JsonText(document);
}

/// What all pages show.
Site Router::MakeSite() {
  std::vector<VolumeRow> rows = Readers::Lease(readers_)->Volumes(MOST_LIST_BYTES);
  // The snapshot has no more than these.
  const bool isFull = rows.size() >= MOST_SHOWN_VOLUMES || CutOff(rows, MOST_SHOWN_VOLUMES, false);
  Site site{.snapshot = snapshot_.Status(),
            .volumes = Combine(rows, zophotos::ReadActivity()),
            .mayHaveMoreVolumes = isFull};
  site.mayHaveMoreVolumes = CutOff(site.volumes, MOST_SHOWN_VOLUMES, false) || isFull;
  return site;
}

/// The part of a list that the request asks for: the newest photos, those before one, or those
/// after one.
PhotoList Router::MakeList(const Target& target, const Filter& filter, std::size_t count) {
  const auto before = ParseId(target, "before");
  const auto after = ParseId(target, "after");
  if (before && after) {
    throw BadQuery("The parameters before and after cannot be combined.");
  }
  PhotoList list;
  const Readers::Lease reader(readers_);
  // Each photo's link on a page repeats the filter.
  const std::size_t inLink = filter.words.size() + (filter.volume ? filter.volume->size() : 0);
  if (after) {
    list.photos = reader->PhotosAfter(filter, *after, count + 1);
    list.hasNewer = CutOff(list.photos, count, true, inLink);
    const PhotoId last = list.photos.empty() ? *after : list.photos.back().id;
    list.hasOlder = !reader->Photos(filter, last, 1).empty();
  } else {
    list.photos = reader->Photos(filter, before, count + 1);
    list.hasOlder = CutOff(list.photos, count, false, inLink);
    if (before) {
      const PhotoId first = list.photos.empty() ? *before : list.photos.front().id;
      list.hasNewer = !reader->PhotosAfter(filter, first, 1).empty();
    }
  }
  files_.Expect(list.photos);
  return list;
}

} // namespace orva::web
