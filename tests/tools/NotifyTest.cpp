#include "NotifyTest.h"

#include "orvautil/Core.h"

#include "support/Programs.h"

#include <poll.h>
#include <sys/mount.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <system_error>
#include <utility>

namespace orva::test {

using core::ORVA_NOTIFICATION_SOCKET;

bool IsReadable(int descriptor, Clock::time_point deadline) {
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
  pollfd ready{.fd = descriptor, .events = POLLIN, .revents = 0};
  return poll(&ready, 1, static_cast<int>(std::max<long>(left.count(), 0))) == 1;
}

Arguments NotifyCommand(Arguments arguments) {
  arguments.insert(arguments.begin(), ProgramPath("orva-notify"));
  return arguments;
}

Answer RunNotify(const Arguments& arguments, const std::string& input) {
  Program program(NotifyCommand(arguments), {.input = input});
  const std::string line = program.ReadLine();
  return {program.WaitForEnd(), line};
}

std::size_t Ask(const notify::Request& request) {
  return notify::Ask(ORVA_NOTIFICATION_SOCKET, request, DEADLINE);
}

NotifyClient::NotifyClient() : socket_(util::Socket::Address(ORVA_NOTIFICATION_SOCKET), false) {}

void NotifyClient::Write(const std::string& text) {
  ASSERT_EQ(socket_.Write(text.data(), static_cast<unsigned>(text.size())), text.size());
}

std::string NotifyClient::ReadMessage() {
  const std::string delimiter(4, '\0');
  const auto deadline = Clock::now() + DEADLINE;
  std::vector<char> chunk(std::size_t{256} * 1024);
  std::size_t searched = 0;
  for (;;) {
    const auto end = input_.find(delimiter, searched);
    if (end != std::string::npos) {
      std::string message = input_.substr(0, end);
      input_.erase(0, end + delimiter.size());
      return message;
    }
    searched = std::max<std::size_t>(input_.size(), 3) - 3;
    if (!IsReadable(socket_.Descriptor(), deadline)) {
      return "(deadline)";
    }
    const unsigned count = socket_.Read(chunk.data(), static_cast<unsigned>(chunk.size()));
    if (count == 0) {
      return input_.empty() ? "(end)" : "(end within a message)";
    }
    input_.append(chunk.data(), count);
  }
}

std::vector<std::string> NotifyClient::ReadMessages(std::size_t count) {
  std::vector<std::string> messages;
  while (messages.size() < count) {
    messages.push_back(ReadMessage());
  }
  return messages;
}

void OrvaNotify::SetUp() {
  std::filesystem::create_directories(folder_);
  std::filesystem::create_directories("/shares");
}

void OrvaNotify::TearDown() {
  service_.reset();
  std::filesystem::remove_all(std::filesystem::path(ORVA_NOTIFICATION_SOCKET).parent_path());
  std::filesystem::remove_all(folder_);
}

void OrvaNotify::Serve(Arguments options) {
  options.insert(options.begin(), "serve");
  service_ = std::make_unique<Program>(NotifyCommand(options));
  ASSERT_EQ(service_->ReadLine(), "listening on " + ORVA_NOTIFICATION_SOCKET);
}

std::string OrvaNotify::FileWith(const std::string& content) const {
  std::string name = folder_ + "/message";
  std::ofstream(name, std::ios::binary) << content;
  return name;
}

TmpfsMount::TmpfsMount(std::string mountPoint) : mountPoint_(std::move(mountPoint)) {
  std::filesystem::create_directories(mountPoint_);
  if (mount("none", mountPoint_.c_str(), "tmpfs", 0, "size=64k") != 0) {
    throw std::system_error(errno, std::generic_category(), "mount " + mountPoint_);
  }
}

TmpfsMount::~TmpfsMount() {
  if (mounted_) {
    umount2(mountPoint_.c_str(), MNT_DETACH);
  }
}

void TmpfsMount::Unmount() {
  if (umount2(mountPoint_.c_str(), 0) != 0) {
    throw std::system_error(errno, std::generic_category(), "umount " + mountPoint_);
  }
  mounted_ = false;
}

} // namespace orva::test
