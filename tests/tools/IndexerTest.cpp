#include "IndexerTest.h"

#include "support/Programs.h"
#include "system/Database.h"
#include "system/Deadline.h"

#include "CatalogSchema.h"
#include "Indexer.h"
#include "orvadb/VolumeDB.h"
#include "orvautil/Core.h"

#include <nlohmann/json.hpp>

#include <poll.h>
#include <sys/socket.h>
#include <syslog.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <iterator>

namespace orva::test {

namespace fs = std::filesystem;
using SteadyClock = std::chrono::steady_clock;

namespace {

/// How many clients have connected to the notification service.
long CountClients() {
  std::ifstream output("/tmp/orva-notify.out");
  long count = 0;
  for (std::string line; std::getline(output, line);) {
    count += line.starts_with("client ") && line.ends_with(" connected") ? 1 : 0;
  }
  return count;
}

} // namespace

IndexerTest::IndexerTest() {
  fs::create_directories("/shares");
}

IndexerTest::~IndexerTest() = default;

void IndexerTest::StartService() {
  service_.reset();
  service_ =
      std::make_unique<Program>(Program::Arguments{ProgramPath("orva-notify"), "serve", "--watch"},
                                Program::Options{.output = "/tmp/orva-notify.out"});
  const auto end = SteadyClock::now() + DEADLINE;
  do {
    observer_ = std::make_unique<util::ClientSocket>(
        util::Socket::Address(core::ORVA_NOTIFICATION_SOCKET), true);
  } while (!observer_->IsOpen() && SteadyClock::now() < end);
  ASSERT_TRUE(observer_->IsOpen());
  ASSERT_EQ(observer_->Write("observe\n", 8), 8U);
  ASSERT_TRUE(Await([] { return CountClients() > 0; }));
}

void IndexerTest::StartIndexer(Program::Arguments prefix) {
  const long clients = CountClients();
  prefix.push_back(ProgramPath("orva-indexer"));
  indexer_ = std::make_unique<Program>(
      prefix,
      Program::Options{.output = "/tmp/orva-indexer.out",
                       .environment = {std::string("STATE_DIRECTORY=") + STATE_DIRECTORY,
                                       std::string("RUNTIME_DIRECTORY=") + RUNTIME_DIRECTORY}});
  if (service_) {
    ASSERT_TRUE(Await([clients] { return CountClients() > clients; }));
  }
}

void IndexerTest::StartIndexerIn(const Program::Arguments& surroundings) {
  std::string asan = "ASAN_OPTIONS=verify_asan_link_order=0";
  if (const char* const options = std::getenv("ASAN_OPTIONS")) {
    asan += std::string(":") + options;
  }
  Program::Arguments prefix = {"env", asan,
                               "LD_PRELOAD=" + ProgramPath("libsurroundings_probe.so")};
  prefix.insert(prefix.end(), surroundings.begin(), surroundings.end());
  StartIndexer(prefix);
}

void IndexerTest::StopIndexer() {
  indexer_->Signal(SIGTERM);
  EXPECT_EQ(indexer_->WaitForEnd(), 0);
}

void IndexerTest::ReadNotifications(int milliseconds) {
  if (!observer_) {
    return;
  }
  pollfd ready{.fd = observer_->Descriptor(), .events = POLLIN, .revents = 0};
  if (poll(&ready, 1, milliseconds) != 1) {
    return;
  }
  std::array<char, 65536> chunk;
  ssize_t count = 0;
  while ((count = recv(observer_->Descriptor(), chunk.data(), chunk.size(), MSG_DONTWAIT)) > 0) {
    input_.append(chunk.data(), static_cast<std::size_t>(count));
  }
  if (count == 0) {
    observer_.reset(); // the service has ended
  }
}

bool IndexerTest::Await(const std::function<bool()>& condition) {
  constexpr int INTERVAL = 50; // milliseconds
  const auto end = SteadyClock::now() + DEADLINE;
  while (SteadyClock::now() < end) {
    if (condition()) {
      return true;
    }
    if (observer_) {
      ReadNotifications(INTERVAL);
    } else {
      poll(nullptr, 0, INTERVAL);
    }
  }
  return condition();
}

Lines IndexerTest::StartAndAwaitCatalog(const std::string& volume) {
  StartService();
  StartIndexer();
  return AwaitCatalog(volume);
}

Lines IndexerTest::AwaitCatalog(const std::string& volume) {
  Lines expected;
  Lines found;
  Await([&] {
    expected = Expected(volume);
    found = Described(volume);
    return expected == found;
  });
  Lines differences;
  std::ranges::set_symmetric_difference(expected, found, std::back_inserter(differences));
  return differences;
}

bool IndexerTest::AwaitLog(const std::string& text) {
  return Await([&] { return !LogLines(text).empty(); });
}

Lines IndexerTest::LogLines(const std::string& text) const {
  Lines lines;
  for (const LogLine& line : log_.Lines()) {
    if (line.text.starts_with("Volume ") && line.text.find(text) != std::string::npos &&
        (line.priority & LOG_LOCAL1) == LOG_LOCAL1) {
      lines.push_back(line.text);
    }
  }
  return lines;
}

Lines IndexerTest::ErrorLines() const {
  Lines lines;
  for (const LogLine& line : log_.Lines()) {
    if (line.priority == (LOG_LOCAL1 | LOG_ERR)) {
      lines.push_back(line.text);
    }
  }
  return lines;
}

Lines IndexerTest::Events(const std::string& volume) {
  ReadNotifications(0);
  Lines events;
  const std::string start = "<ORVANotification Name=\"";
  for (auto begin = input_.find(start); begin != std::string::npos;
       begin = input_.find(start, begin)) {
    begin += start.size();
    const auto end = input_.find('"', begin);
    const std::string mountPoint = " MountPoint=\"" + volume + '"';
    if (input_.compare(end + 1, mountPoint.size(), mountPoint) == 0) {
      events.push_back(input_.substr(begin, end - begin));
    }
  }
  return events;
}

void IndexerTest::Send(const std::string& event, const std::string& volume) {
  EXPECT_EQ(test::Run({ProgramPath("orva-notify"), "send", event, volume}).status, 0);
}

void IndexerTest::PlugDirectory(const std::string& directory) {
  std::ofstream("/tmp/message") << "<ORVANotification Name=\"Plugged\" Kind=\"directory\" "
                                   "MountPoint=\"" +
                                       directory + "\"/>";
  EXPECT_EQ(test::Run({ProgramPath("orva-notify"), "send", "--raw", "/tmp/message"}).status, 0);
}

Lines IndexerTest::Query(const std::string& volume, const std::string& sql) {
  try {
    Database catalog(CatalogOf(volume));
    catalog.setBusyTimeout(5000); // the indexer locks it for moments
    return catalog.Run(sql);
  } catch (const SQLite::Exception&) {
    return {};
  }
}

namespace {

constexpr char DESCRIPTION[] =
    "SELECT path, category, lastModifiedDate, isBackup, isHidden, isSystem, ext, size FROM Files "
    "WHERE isDeleted = 0 UNION ALL "
    "SELECT path, category, lastModifiedDate, isBackup, isHidden, isSystem, '', 0 FROM Folders "
    "WHERE isDeleted = 0 ORDER BY 1";

} // namespace

Lines IndexerTest::Described(const std::string& volume) {
  Lines lines = Query(volume, DESCRIPTION);
  std::ranges::sort(lines);
  return lines;
}

Lines IndexerTest::Expected(const std::string& volume) const {
  const std::string place = "/tmp/expected";
  fs::remove_all(place);
  fs::create_directories(place);
  catalog::Indexer(*catalog::OpenCatalog(place), volume, std::time(nullptr)).Run();
  Lines lines = Query(place, DESCRIPTION);
  std::ranges::sort(lines);
  return lines;
}

void IndexerTest::Write(const std::string& path, const std::string& content) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
}

std::string IndexerTest::State(const std::string& volume) {
  std::ifstream file(std::string(RUNTIME_DIRECTORY) + "/status.json");
  const auto status = nlohmann::json::parse(file, nullptr, false);
  if (status.is_object()) {
    for (const auto& entry : status["volumes"]) {
      if (entry["mountPoint"] == volume + "/") {
        return entry["state"];
      }
    }
  }
  return "absent";
}

} // namespace orva::test
