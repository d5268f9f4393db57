#include "Appliance.h"

#include "Database.h"
#include "Expectations.h"
#include "Tracer.h"
#include "orvautil/Core.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>
#include <stdexcept>

namespace orva::test {

namespace {

const std::string REJECTION = "ERROR ! Node name = ";
const std::string BARRIER = "barrier";
const std::string DIRECTORY = "/tmp/daemon";
const std::string OUTPUT = "/tmp/daemon.out";

std::string MaskAddresses(const std::string& text) {
  static const std::regex ADDRESS("0x[0-9a-f]+");
  return std::regex_replace(text, ADDRESS, "ADDRESS");
}

std::string DatabasePath(const std::string& location) {
  return location + "/.zophotos/zophotos.db";
}

} // namespace

void Appliance::Start(const std::vector<std::string>& environment) {
  daemon_ = std::make_unique<DaemonProcess>(DIRECTORY, OUTPUT, environment);
  outputTaken_ = 0;
  Barrier();
}

void Appliance::Prepare() {
  daemon_ = std::make_unique<DaemonProcess>(DIRECTORY, OUTPUT, std::vector<std::string>(), true);
  outputTaken_ = 0;
}

void Appliance::StartWithOutput(const std::string& output) {
  daemon_ = std::make_unique<DaemonProcess>(DIRECTORY, output);
  outputTaken_ = 0;
  Barrier();
}

int Appliance::Run(const std::vector<std::string>& environment) {
  daemon_ = std::make_unique<DaemonProcess>(DIRECTORY, OUTPUT, environment);
  return daemon_->AwaitEnd();
}

int Appliance::Shutdown() {
  service_.Stop();
  return daemon_->AwaitEnd();
}

std::vector<LogLine> Appliance::Handle(const std::string& message) {
  service_.Send(message);
  Barrier();
  return TakeLog();
}

void Appliance::Barrier() {
  const std::string line = SendBarrier();
  if (!log_.Await(Error(line))) {
    throw std::runtime_error("not logged: " + line);
  }
}

std::string Appliance::SendBarrier() {
  const std::string name = BARRIER + std::to_string(++barriers_);
  service_.Send("<" + name + " about=\"ORVANotification\"/>");
  return REJECTION + name;
}

std::chrono::milliseconds Appliance::HandleUntilSlept(Tracer& tracer, const std::string& message,
                                                      std::chrono::milliseconds time) {
  service_.Send(message);
  const std::string last = SendBarrier();
  std::chrono::milliseconds slept{};
  tracer.RunUntil([&](const SystemCall& call) {
    slept += std::chrono::duration_cast<std::chrono::milliseconds>(tracer.Sleep(call));
    return slept >= time || tracer.Data(call).find(last) != std::string::npos;
  });
  return slept;
}

std::vector<LogLine> Appliance::TakeLog() {
  const std::vector<LogLine> fresh = log_.Lines(logTaken_);
  logTaken_ += fresh.size();
  std::vector<LogLine> taken;
  for (const LogLine& line : fresh) {
    if (!line.text.starts_with(REJECTION + BARRIER) &&
        !line.text.starts_with("Iterating over mount point ")) {
      taken.push_back({line.priority, MaskTimes(line.text)});
    }
  }
  return taken;
}

std::vector<std::string> Appliance::TakeOutput() {
  const std::vector<std::string> all = daemon_->StandardOutput();
  std::vector<std::string> taken;
  for (; outputTaken_ < all.size(); ++outputTaken_) {
    taken.push_back(MaskAddresses(all[outputTaken_]));
  }
  return taken;
}

std::string Appliance::Locator() {
  const std::string path = "/tmp/zophotodbmerger.conf";
  std::ifstream file(path, std::ios::binary);
  if (!file || std::filesystem::is_directory(path)) {
    return "(absent)";
  }
  return {std::istreambuf_iterator<char>(file), {}};
}

MergedDatabase::MergedDatabase(const std::string& location) : database_(DatabasePath(location)) {}

std::vector<std::string> MergedDatabase::Folders() const {
  return database_.Run("SELECT f.name, coalesce(p.name, f.parent_folder_id), f.modified_date, "
                       "f.volume FROM Folders f LEFT JOIN Folders p "
                       "ON p.folder_id = f.parent_folder_id ORDER BY f.name");
}

std::vector<std::string> MergedDatabase::Files() const {
  return database_.Run("SELECT coalesce(o.name, 'no folder: ') || f.name, f.modified_date, "
                       "f.created_date, f.volume FROM Files f LEFT JOIN Folders o "
                       "ON o.folder_id = f.folder_id ORDER BY 1");
}

std::vector<std::string> MergedDatabase::Statistics() const {
  return database_.Run("SELECT volume, photos_xcoded, photos_total, last_updated_time "
                       "FROM Statistics ORDER BY volume");
}

std::vector<std::string> MergedDatabase::Content() const {
  std::vector<std::string> content = Folders();
  for (const std::vector<std::string>& rows :
       {Files(), Statistics(), database_.Run("SELECT id, mc_version, desc, etype FROM Status"),
        database_.Run("SELECT type, name, tbl_name, sql FROM sqlite_master ORDER BY name")}) {
    content.insert(content.end(), rows.begin(), rows.end());
  }
  return content;
}

std::vector<std::string> MergedDatabase::Faults() const {
  std::vector<std::string> faults = database_.Run("PRAGMA integrity_check");
  std::erase(faults, "ok");
  const std::vector<std::string> orphans = database_.Run("PRAGMA foreign_key_check");
  faults.insert(faults.end(), orphans.begin(), orphans.end());
  return faults;
}

std::vector<std::string> PathsBelow(const std::string& directory) {
  std::vector<std::string> paths;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(directory)) {
    paths.push_back(entry.path());
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

bool HasMergedDatabase(const std::string& location) {
  return std::filesystem::exists(DatabasePath(location));
}

} // namespace orva::test
