#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>

namespace orva::test {

struct HttpResponse {
  int status = 0;
  std::map<std::string, std::string> headers{}; ///< names in lower case
  std::string body{};

  /// The value of a header; empty if it is missing.
  std::string Header(const std::string& name) const;
};

/// A connection to a server on the loopback that sends and reads bytes as a test wants it. Failures
/// are thrown as std::runtime_error; so is a server that does not send within the deadline.
class HttpConnection {
public:
  explicit HttpConnection(std::uint16_t port);

  /// Sends bytes as they are. What the server does not take any more is dropped.
  void Send(const std::string& bytes) const;

  /// Says that no more is sent.
  void EndRequests() const;

  /// Reads a response with a Content-Length, or without a body if `isHead`.
  HttpResponse Read(bool isHead = false);

  /// Reads the headers of a response; its body follows in Take.
  HttpResponse ReadHeaders();

  /// Reads until `text` has arrived, and returns all up to its end.
  std::string ReadUntil(const std::string& text);

  /// Reads until the server ends the connection, in whatever way.
  std::string ReadToEnd();

  int Socket() const { return socket_.Get(); }

private:
  /// Reads some more. Returns false at the end.
  bool Fill();

  util::FileDescriptor socket_;
  std::string input_;
};

/// A request with the Host header that browsers on this machine send.
std::string HttpGet(const std::string& target, const std::string& moreHeaders = "");

/// Sends one request on a connection of its own.
HttpResponse Get(std::uint16_t port, const std::string& target,
                 const std::string& moreHeaders = "");

} // namespace orva::test
