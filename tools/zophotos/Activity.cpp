#include "Activity.h"

#include "Text.h"

#include <nlohmann/json.hpp>

#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <limits>
#include <utility>

namespace orva::zophotos {

namespace {

using Document = nlohmann::json;

constexpr const char* INDEXER = "/run/orva-indexer";
constexpr const char* TRANSCODER = "/run/orva-transcoder";

/// The package with both services has this folder while it is installed. An appliance, with
/// services of its own, does not have it.
constexpr const char* PACKAGE = "/var/lib/zophotodbmerger-standalone";

/// The content of a regular file of at most 1 MiB.
std::optional<std::string> ReadFile(const std::string& path) {
  constexpr std::size_t limit = 1 << 20;
  const util::FileDescriptor file(
      open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status {};
  if (!file || fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    return std::nullopt;
  }
  std::string text(limit + 1, '\0');
  std::size_t size = 0;
  ssize_t count = 0;
  while (size <= limit && (count = read(file.Get(), &text[size], text.size() - size)) > 0) {
    size += static_cast<std::size_t>(count);
  }
  if (count < 0 || size > limit) {
    return std::nullopt;
  }
  text.resize(size);
  return text;
}

/// A member of `object`. Throws Document::exception if it is missing or has another type.
template <typename Value>
const Value& Member(const Document& object, const char* name) {
  return object.at(name).get_ref<const Value&>();
}

std::int64_t Number(const Document& object, const char* name) {
  constexpr std::uint64_t largest = std::numeric_limits<std::int64_t>::max();
  return static_cast<std::int64_t>(
      std::min(Member<Document::number_unsigned_t>(object, name), largest));
}

Indexing ReadIndexing(const Document& volume) {
  return {.state = Member<std::string>(volume, "state"),
          .foldersWaiting = Number(volume, "foldersWaiting")};
}

Rendering ReadRendering(const Document& volume) {
  return {.waiting = Number(volume, "waiting"),
          .failed = Number(volume, "failed"),
          .isActive = Member<bool>(volume, "rendering")};
}

/// The volumes in the status file in `folder`; nothing if it is missing or malformed.
template <typename Status>
std::optional<std::map<std::string, Status>> Read(const std::string& folder,
                                                  Status (*readVolume)(const Document&)) {
  const auto text = ReadFile(folder + "/status.json");
  if (!text) {
    return std::nullopt;
  }
  try {
    const Document document = Document::parse(*text);
    std::map<std::string, Status> volumes;
    for (const Document& volume : Member<Document::array_t>(document, "volumes")) {
      std::string mountPoint = Member<std::string>(volume, "mountPoint");
      if (!mountPoint.ends_with('/')) {
        mountPoint += '/';
      }
      volumes[mountPoint] = readVolume(volume);
    }
    return volumes;
  } catch (const Document::exception&) {
    return std::nullopt;
  }
}

std::string Describe(const Indexing& indexing) {
  const std::map<std::string, std::string> texts{{"walking", "being indexed"},
                                                 {"watching", "watched"},
                                                 {"timed", "indexed at intervals"},
                                                 {"read-only", "read-only, not indexed"},
                                                 {"unusable", "cannot be indexed"}};
  const auto text = texts.find(indexing.state);
  return (text == texts.end() ? Printable(indexing.state) : text->second) +
         (indexing.foldersWaiting == 0
              ? ""
              : ", " + Count(indexing.foldersWaiting, "folder") + " waiting");
}

} // namespace

Activity ReadActivity() {
  return {.indexer = Read(INDEXER, &ReadIndexing),
          .transcoder = Read(TRANSCODER, &ReadRendering),
          .areInstalled = access(PACKAGE, F_OK) == 0};
}

std::string DescribeStopped(const Activity& activity) {
  if (activity.indexer && activity.transcoder) {
    return "";
  }
  if (activity.transcoder) {
    return "orva-indexer does not run.";
  }
  if (activity.indexer) {
    return "orva-transcoder does not run.";
  }
  return activity.areInstalled ? "orva-indexer and orva-transcoder do not run." : "";
}

std::map<std::string, VolumeActivity> VolumesOf(const Activity& activity) {
  std::map<std::string, VolumeActivity> volumes;
  if (activity.indexer) {
    for (const auto& [mountPoint, indexing] : *activity.indexer) {
      volumes[mountPoint].indexing = &indexing;
    }
  }
  if (activity.transcoder) {
    for (const auto& [mountPoint, rendering] : *activity.transcoder) {
      volumes[mountPoint].rendering = &rendering;
    }
  }
  return volumes;
}

std::string Describe(const VolumeActivity& activity) {
  std::string text;
  if (activity.indexing != nullptr) {
    text = Describe(*activity.indexing);
  }
  if (activity.rendering != nullptr && activity.rendering->isActive) {
    text += (text.empty() ? "" : "; ") + std::string("rendering");
  }
  return text.empty() ? "-" : text;
}

ActivityWatch::ActivityWatch() : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {}

bool ActivityWatch::Wait(std::chrono::milliseconds time) {
  const bool isOther = WatchFolders();
  pollfd ready{.fd = inotify_.Get(), .events = POLLIN, .revents = 0};
  poll(&ready, 1, isOther ? 0 : static_cast<int>(time.count()));
  // Without inotify, the files are read each time.
  return TakeEvents() || isOther || !inotify_;
}

/// Watches the folders. Returns whether one of them is another one than before. Does nothing for a
/// folder that is watched already.
bool ActivityWatch::WatchFolders() {
  // The services replace their files.
  const auto watch = [this](const char* folder) {
    return inotify_add_watch(inotify_.Get(), folder, IN_MOVED_TO | IN_DELETE | IN_ONLYDIR);
  };
  const std::array<int, 2> folders{watch(INDEXER), watch(TRANSCODER)};
  return folders != std::exchange(folders_, folders);
}

/// Takes all events. Returns whether there were any.
bool ActivityWatch::TakeEvents() const {
  std::array<char, 4096> events{};
  bool any = false;
  while (read(inotify_.Get(), events.data(), events.size()) > 0) {
    any = true;
  }
  return any;
}

} // namespace orva::zophotos
