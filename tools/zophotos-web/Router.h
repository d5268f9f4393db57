#pragma once

#include "Readers.h"
#include "Request.h"
#include "Response.h"
#include "VolumeFiles.h"
#include "zophotos-web/Page.h"

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>

namespace orva::web {

/// Answers requests: pages for people, JSON for programs, and the files of photos. Clients name
/// photos and folders by their ids, never by paths. Any thread.
class Router {
public:
  /// The snapshot must outlive the object. `log` gets what people should know about the volumes.
  Router(const Snapshot& snapshot, RenditionIds::Log log)
      : snapshot_(snapshot), readers_(snapshot), files_(std::move(log)) {}

  /// Throws std::exception or std::string when the snapshot cannot be read.
  Response Answer(const Request& request);

  /// The response to a request for `path` that is not served: JSON for the JSON interface,
  /// otherwise a page. `reason` is a sentence for people.
  static Response Refuse(int status, std::string_view path, const std::string& reason);

private:
  Response AnswerPage(const Request& request, std::string_view path);
  Response AnswerPhoto(const Request& request, PhotoId id, std::string_view rest);
  Response AnswerJson(const Request& request, std::string_view path);

  Response NewestView(const Target& target);
  Response SearchView(const Target& target);
  Response FoldersView(const Target& target, std::optional<std::int64_t> folder);
  Response PhotoView(const Target& target, PhotoId id);
  Response Rendition(const Request& request, PhotoId id);
  Response Original(const Request& request, PhotoId id);
  Response Rendition(const Request& request, const Photo& photo);
  Response Original(const Request& request, const Photo& photo);

  Response PhotosJson(const Target& target);
  Response PhotoJson(const Target& target, PhotoId id);
  Response FoldersJson(const Target& target);
  Response FolderJson(std::int64_t id);
  Response MonthsJson(const Target& target);
  Response VolumesJson();
  Response StatusJson();

  Site MakeSite();
  PhotoList MakeList(const Target& target, const Filter& filter, std::size_t count);

  const Snapshot& snapshot_;
  Readers readers_;
  VolumeFiles files_;
};

} // namespace orva::web
