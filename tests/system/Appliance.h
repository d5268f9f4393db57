#pragma once

#include "DaemonProcess.h"
#include "Database.h"
#include "NotificationService.h"
#include "Syslog.h"
#include "Volume.h"

#include <chrono>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

class Tracer;

/// The appliance around the daemon: its system log, its notification service and the files that
/// the daemon writes, in the private root of the test. A test creates volumes, starts the daemon,
/// sends it messages and checks the results.
class Appliance {
public:
  /// Starts the log and the notification service. The daemon does not run yet.
  Appliance() = default;

  /// Starts the daemon and waits until it reads notifications. `environment` as DaemonProcess.
  void Start(const std::vector<std::string>& environment = {});

  /// Prepares the daemon, which starts at SIGCONT. Does not wait for it.
  void Prepare();

  /// Start, with standard output in another file than the one that TakeOutput reads.
  void StartWithOutput(const std::string& output);

  /// Starts a daemon that is not expected to read notifications, and waits for its end.
  int Run(const std::vector<std::string>& environment = {});

  /// Ends the notification service and waits for the end of the daemon, which follows.
  int Shutdown();

  /// True while a daemon runs.
  bool IsRunning() const { return daemon_ != nullptr && daemon_->IsRunning(); }

  /// Sends a message and waits until the daemon has handled it. Returns what the daemon logged
  /// for it, as TakeLog does.
  std::vector<LogLine> Handle(const std::string& message);

  /// Waits until the daemon has handled everything that was sent: sends a message with another
  /// root element and waits for the log line that rejects it.
  void Barrier();

  /// Sends the message of Barrier, and returns the text of the log line that rejects it.
  std::string SendBarrier();

  /// Lets the daemon, which `tracer` holds, handle `message` until its sleeps add up to `time`, or
  /// to the end of the message. Returns the sum of the sleeps, the one that begins included.
  std::chrono::milliseconds HandleUntilSlept(Tracer& tracer, const std::string& message,
                                             std::chrono::milliseconds time);

  /// What was logged since the last call, without the lines of Barrier and without the merger
  /// thread's "Iterating over mount point" lines, which come at any time. Elapsed times are
  /// replaced by TIME.
  std::vector<LogLine> TakeLog();

  /// What the daemon wrote to standard output since the last call. The addresses of objects are
  /// replaced by ADDRESS.
  std::vector<std::string> TakeOutput();

  /// All bytes of the locator file; "(absent)" when there is none.
  static std::string Locator();

  Syslog& Log() { return log_; }
  NotificationService& Service() { return service_; }
  DaemonProcess& Daemon() { return *daemon_; }
  const DaemonProcess& Daemon() const { return *daemon_; }

private:
  Syslog log_;
  NotificationService service_;
  std::unique_ptr<DaemonProcess> daemon_;
  std::size_t logTaken_ = 0;
  std::size_t outputTaken_ = 0;
  int barriers_ = 0;
};

/// The merged database at a location ("/shares" or a volume's path), read as rows without ids.
class MergedDatabase {
public:
  /// Throws std::runtime_error when there is no database.
  explicit MergedDatabase(const std::string& location);

  /// "name|parent's name|modified_date|volume", by name. The root's parent is "-1".
  std::vector<std::string> Folders() const;
  /// "folder's name and file's name|modified_date|created_date|volume", by name.
  std::vector<std::string> Files() const;
  /// "volume|photos_xcoded|photos_total|last_updated_time", by volume.
  std::vector<std::string> Statistics() const;

  /// All of these, the schema and the status row without its time. The same for databases with
  /// equal content.
  std::vector<std::string> Content() const;

  /// The faults that SQLite finds in the file.
  std::vector<std::string> Faults() const;

  const Database& Rows() const { return database_; }

private:
  Database database_;
};

/// The row of the root folder, which every merged database has.
inline const std::string ROOT_FOLDER = "/shares/|-1|0|<DUMMY>";

/// All files and directories below a directory, by path.
std::vector<std::string> PathsBelow(const std::string& directory);

/// True when there is a merged database file at a location.
bool HasMergedDatabase(const std::string& location);

} // namespace orva::test
