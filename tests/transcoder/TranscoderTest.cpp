#include "transcoder/TranscoderTest.h"

#include "transcoder/Photos.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Renditions.h"
#include "Sql.h"
#include "orva-notify/Notification.h"
#include "orvadb/File.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"
#include "support/Programs.h"
#include "system/Deadline.h"

#include <poll.h>
#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <stdexcept>

namespace orva::test {

namespace fs = std::filesystem;

void TranscoderTest::SetUp() {
  log_ = std::make_unique<Syslog>();
  volume_ = std::make_unique<Volume>("A", "1g");
  root_ = volume_->Path();
  fs::create_directories(RUNTIME);
  StartService();
  StartTranscoder();
}

void TranscoderTest::TearDown() {
  transcoder_.reset();
  service_.reset();
  volume_.reset();
}

void TranscoderTest::StartService() {
  service_ =
      std::make_unique<Program>(Program::Arguments{ProgramPath("orva-notify"), "serve", "--watch"});
  service_->ReadLineWith("listening");
}

void TranscoderTest::StartTranscoder(const Lines& launcher) {
  Program::Arguments command = launcher;
  command.push_back(ProgramPath("orva-transcoder"));
  transcoder_ = std::make_unique<Program>(
      command, Program::Options{.errors = Program::Errors::Inherited,
                                .environment = {"RUNTIME_DIRECTORY=" + std::string(RUNTIME)}});
  service_->ReadLineWith("connected");
}

void TranscoderTest::RestartInFileSystem(const std::string& size) {
  KillTranscoder();
  RunChecked({"mount", "-t", "tmpfs", "-o", "size=" + size, "staging", RUNTIME});
  StartTranscoder();
}

void TranscoderTest::Announce(const std::string& event, const std::string& mountPoint) {
  RunChecked({ProgramPath("orva-notify"), "send", event, mountPoint});
}

void TranscoderTest::AnnounceDirectory(const std::string& mountPoint) {
  std::string message = notify::Compose(notify::Event::Plugged, mountPoint);
  message.insert(message.size() - 2, " Kind=\"directory\"");
  WriteBytes("/tmp/message", message);
  RunChecked({ProgramPath("orva-notify"), "send", "--raw", "/tmp/message"});
}

long long TranscoderTest::AddWaiting(const std::string& path) const {
  return AddAllWaiting({path}).front();
}

std::vector<long long> TranscoderTest::AddAllWaiting(const Lines& paths) const {
  const auto catalog = catalog::OpenCatalog(root_);
  db::Transaction transaction(*catalog, catalog::BUSY_TIMEOUT);
  const std::time_t stamp = catalog::NextStamp(*catalog, std::time(nullptr));
  std::vector<long long> ids;
  for (const std::string& path : paths) {
    struct stat status {};
    lstat(At(path).c_str(), &status);
    db::File file;
    file.id = catalog::SelectNumber(*catalog, "SELECT id FROM Files WHERE path = ?", path);
    if (file.id == 0) {
      file.id = catalog::SelectNumber(*catalog, "SELECT coalesce(max(id), 0) + 1 FROM Files");
    }
    file.folderId = -1;
    file.path = path;
    file.name = path.substr(path.rfind('/') + 1);
    file.category = 3;
    file.lastModifiedDate = status.st_mtim.tv_sec;
    file.size = status.st_size;
    file.status = catalog::INDEXED;
    file.lastUpdatedDate = stamp;
    file.ext = fs::path(file.name).extension().native();
    catalog::StoreFile(*catalog, file);
    catalog::Execute(*catalog, "DELETE FROM Failures WHERE fileId = ?", file.id);
    ids.push_back(file.id);
  }
  transaction.Commit();
  return ids;
}

void TranscoderTest::AddRemoved(const std::string& path) const {
  const auto catalog = catalog::OpenCatalog(root_);
  db::Transaction transaction(*catalog, catalog::BUSY_TIMEOUT);
  const std::time_t stamp = catalog::NextStamp(*catalog, std::time(nullptr));
  const long long id = catalog::SelectNumber(*catalog, "SELECT id FROM Files WHERE path = ?", path);
  catalog::Execute(*catalog, "UPDATE Files SET isDeleted = 1, status = 1 WHERE id = ?", id);
  catalog::StoreTranscoding(*catalog, id, catalog::WITHDRAWN, stamp);
  catalog::Execute(*catalog, "INSERT INTO Removals(fileId) VALUES(?)", id);
  transaction.Commit();
}

TranscoderTest::Lines TranscoderTest::Query(const std::string& sql, int columns) const {
  const auto catalog = catalog::OpenCatalog(root_);
  Lines lines;
  catalog::ForEachRow(*catalog, sql.c_str(), [&](const db::Statement& row) {
    std::string line = row.GetText(0);
    for (int column = 1; column < columns; ++column) {
      line += '|' + row.GetText(column);
    }
    lines.push_back(line);
  });
  return lines;
}

long long TranscoderTest::Number(const std::string& sql) const {
  return catalog::SelectNumber(*catalog::OpenCatalog(root_), sql.c_str());
}

long long TranscoderTest::IdOf(const std::string& path) const {
  return catalog::SelectNumber(*catalog::OpenCatalog(root_), "SELECT id FROM Files WHERE path = ?",
                               path);
}

std::string TranscoderTest::StateOf(const std::string& path) const {
  const auto catalog = catalog::OpenCatalog(root_);
  db::Statement row(*catalog, "SELECT status, reason FROM Files LEFT JOIN Failures "
                              "ON fileId = Files.id WHERE path = ? AND isDeleted = 0");
  row.BindText(1, path);
  if (!row.Fetch()) {
    return "absent";
  }
  switch (row.GetInt(0)) {
  case catalog::RENDERED:
    return "finished";
  case catalog::UNRENDERABLE:
    return "failed: " + row.GetText(1);
  default:
    return "waiting";
  }
}

long long TranscoderTest::Waiting() const {
  return catalog::CountWaiting(*catalog::OpenCatalog(root_));
}

std::string TranscoderTest::RenditionOf(long long id) const {
  return At(catalog::RenditionPath(id));
}

std::string TranscoderTest::Rendition(const std::string& path) const {
  return RenditionOf(IdOf(path));
}

void TranscoderTest::RenderAll() const {
  Announce("scanned");
  ASSERT_TRUE(Await([this] { return Waiting() == 0; })) << Status();
}

bool TranscoderTest::Await(const std::function<bool()>& condition, int pause) {
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > end) {
      return false;
    }
    poll(nullptr, 0, pause);
  }
  return true;
}

bool TranscoderTest::AwaitSent(const std::string& text) {
  std::string line;
  do {
    line = service_->ReadLine();
    if (line == "(end)" || line == "(deadline)") {
      return false;
    }
  } while (!line.starts_with("sent to") || line.find(text) == std::string::npos);
  return true;
}

TranscoderTest::Lines TranscoderTest::Logged() const {
  Lines lines;
  for (const LogLine& line : log_->Lines()) {
    lines.push_back(line.text);
  }
  return lines;
}

bool TranscoderTest::AwaitLogged(const std::string& line) const {
  return Await([&] {
    const Lines logged = Logged();
    return std::ranges::find(logged, line) != logged.end();
  });
}

void TranscoderTest::CopyPhoto(const std::string& name) const {
  static const std::string photo = "/tmp/photo.jpg";
  if (!fs::exists(photo)) {
    MakePhoto(photo, 600, 400);
  }
  fs::copy_file(photo, At(name));
}

std::string TranscoderTest::Status() {
  return ReadBytes(std::string(RUNTIME) + "/status.json");
}

} // namespace orva::test
