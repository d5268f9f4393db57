#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstdint>
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

/// What a request is answered with. The server adds the headers that all responses have.
struct Response {
  int status = 200;
  std::string type{}; ///< of the body
  std::variant<std::string, FilePart, EventStream> body{};
  std::vector<std::pair<std::string, std::string>> headers{}; ///< more of them
};

} // namespace orva::web
