#pragma once

#include "orva-notify/Control.h"
#include "orvautil/ClientSocket.h"
#include "support/Program.h"
#include "system/Deadline.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

using Arguments = std::vector<std::string>;
using Clock = std::chrono::steady_clock;

/// Waits until `descriptor` is readable. Returns false when the deadline has passed.
bool IsReadable(int descriptor, Clock::time_point deadline);

/// The command line of orva-notify, for Program.
Arguments NotifyCommand(Arguments arguments);

/// The result of a command.
struct Answer {
  int status = 0;
  std::string line; ///< the first line of its output
};

Answer RunNotify(const Arguments& arguments, const std::string& input = "/dev/null");

/// Has the service perform `request`. Returns the number of clients.
std::size_t Ask(const notify::Request& request);

/// A client of the service, like the daemon.
class NotifyClient {
public:
  NotifyClient();

  bool IsConnected() const { return socket_.IsOpen(); }
  void Close() { socket_.Close(); }

  /// Becomes an observer.
  void Write(const std::string& text);

  /// The next message without its delimiter; "(end)" or "(deadline)" when there is none.
  std::string ReadMessage();

  /// The next messages.
  std::vector<std::string> ReadMessages(std::size_t count);

  /// Waits until the next message has begun to arrive, without reading it.
  bool AwaitMessage() const { return IsReadable(socket_.Descriptor(), Clock::now() + DEADLINE); }

private:
  util::ClientSocket socket_;
  std::string input_;
};

/// A service, and what it needs.
class OrvaNotify : public testing::Test {
protected:
  void SetUp() override;
  void TearDown() override;

  /// Starts the service and waits until it listens.
  void Serve(Arguments options = {});

  std::string FileWith(const std::string& content) const;

  const std::string folder_ = "/tmp/orva_notify_test";
  std::unique_ptr<Program> service_;
};

/// A tmpfs at `mountPoint`, which is created, while the object lives.
class TmpfsMount {
public:
  explicit TmpfsMount(std::string mountPoint);
  TmpfsMount(const TmpfsMount&) = delete;
  TmpfsMount& operator=(const TmpfsMount&) = delete;
  ~TmpfsMount();

  /// Unmounts it. Throws std::system_error when something is open there.
  void Unmount();

private:
  const std::string mountPoint_;
  bool mounted_ = true;
};

} // namespace orva::test
