#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstdint>
#include <functional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

namespace orva::web {

/// A part of an open file.
struct FilePart {
  util::FileDescriptor file;
  std::uint64_t offset = 0;
  std::uint64_t size = 0;
};

/// The events of EventStreams, until the client goes.
struct EventStream {};

struct Response;

/// A response that may have to wait for the disk of a volume. `make` is called in another thread;
/// it must not return another one of these.
struct DiskWork {
  std::string volume;
  std::function<Response()> make;
};

/// What a request is answered with. The server adds the headers that all responses have.
struct Response {
  int status = 200;
  std::string type{}; ///< of the body
  std::variant<std::string, FilePart, EventStream, DiskWork> body{};
  std::vector<std::pair<std::string, std::string>> headers{}; ///< more of them
};

} // namespace orva::web
