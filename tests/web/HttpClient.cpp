#include "HttpClient.h"

#include "system/Deadline.h"

#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <stdexcept>

namespace orva::test {

std::string HttpResponse::Header(const std::string& name) const {
  const auto found = headers.find(name);
  return found == headers.end() ? "" : found->second;
}

HttpConnection::HttpConnection(std::uint16_t port)
    : socket_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (connect(socket_.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("cannot connect to the server");
  }
}

void HttpConnection::Send(const std::string& bytes) const {
  std::size_t sent = 0;
  while (sent < bytes.size()) {
    const ssize_t count =
        send(socket_.Get(), bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
    if (count <= 0) {
      return;
    }
    sent += static_cast<std::size_t>(count);
  }
}

void HttpConnection::EndRequests() const {
  shutdown(socket_.Get(), SHUT_WR);
}

HttpResponse HttpConnection::Read(bool isHead) {
  HttpResponse response = ReadHeaders();
  const std::string length = response.Header("content-length");
  const bool hasBody = !isHead && response.status != 304 && !length.empty();
  const std::size_t size = hasBody ? std::stoul(length) : 0;
  while (input_.size() < size && Fill()) {
  }
  response.body = input_.substr(0, size);
  input_.erase(0, size);
  return response;
}

HttpResponse HttpConnection::ReadHeaders() {
  const std::string head = ReadUntil("\r\n\r\n");
  HttpResponse response;
  if (!head.starts_with("HTTP/1.1 ")) {
    throw std::runtime_error("this is not a response: " + head);
  }
  response.status = std::stoi(head.substr(9, 3));
  for (std::size_t begin = head.find("\r\n") + 2; begin + 2 < head.size();) {
    const std::size_t end = head.find("\r\n", begin);
    const std::size_t colon = head.find(": ", begin);
    std::string name = head.substr(begin, colon - begin);
    std::ranges::transform(name, name.begin(),
                           [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    response.headers[name] = head.substr(colon + 2, end - colon - 2);
    begin = end + 2;
  }
  return response;
}

std::string HttpConnection::ReadUntil(const std::string& text) {
  std::size_t found = 0;
  while ((found = input_.find(text)) == std::string::npos) {
    if (!Fill()) {
      throw std::runtime_error("the server ended the connection after: " + input_);
    }
  }
  std::string read = input_.substr(0, found + text.size());
  input_.erase(0, read.size());
  return read;
}

std::string HttpConnection::ReadToEnd() {
  while (Fill()) {
  }
  return std::exchange(input_, {});
}

bool HttpConnection::Fill() {
  pollfd ready{.fd = socket_.Get(), .events = POLLIN, .revents = 0};
  const auto time = std::chrono::duration_cast<std::chrono::milliseconds>(DEADLINE);
  if (poll(&ready, 1, static_cast<int>(time.count())) != 1) {
    throw std::runtime_error("the server sends nothing after: " + input_);
  }
  std::array<char, 65536> bytes{};
  const ssize_t count = recv(socket_.Get(), bytes.data(), bytes.size(), 0);
  if (count > 0) {
    input_.append(bytes.data(), static_cast<std::size_t>(count));
  }
  return count > 0;
}

std::string HttpGet(const std::string& target, const std::string& moreHeaders) {
  return "GET " + target + " HTTP/1.1\r\nHost: localhost\r\n" + moreHeaders + "\r\n";
}

HttpResponse Get(std::uint16_t port, const std::string& target, const std::string& moreHeaders) {
  HttpConnection connection(port);
  connection.Send(HttpGet(target, moreHeaders));
  return connection.Read();
}

} // namespace orva::test
