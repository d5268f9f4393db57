#pragma once

#include <cerrno>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// What is asked of the file system, by SQLite or by the daemon itself.
enum class Request { Open, Read, Write, Sync, Truncate, Size, Lock, Delete, Access, Rename };

/// Which request of an operation goes wrong, and how.
struct FaultPlan {
  enum class Effect {
    Error,    ///< the request fails with `code`
    Stop,     ///< the process ends there
    PowerLoss ///< the same, and files have the content that they had when last synced
  };

  std::string files;               ///< a part of the paths of the files concerned
  std::vector<Request> requests{}; ///< the kinds concerned
  int nth = 0;                     ///< the one that goes wrong, counted from 1; 0 for none
  Effect effect = Effect::Error;
  int code = 0;          ///< SQLite's result code for an Error
  bool forGood = false;  ///< an Error of all that follow as well
  int systemError = EIO; ///< errno of an Error, where the daemon asks past SQLite
  std::string lost{};    ///< a part of the paths of the files whose content a PowerLoss takes
  /// A PowerLoss undoes every creation, renaming and deletion since the directory was last synced.
  bool takesNames = false;
};

/// SQLite's file system with a fault in it, for as long as the object lives: the default one of
/// connections that are opened meanwhile, which must be closed before it ends. One at a time, on
/// the thread that uses SQLite. A write that fails leaves its first half; waiting for a lock takes
/// no time.
class FaultVfs {
public:
  /// Exit status of a process that a plan has stopped.
  static constexpr int STOPPED = 86;

  explicit FaultVfs(FaultPlan plan);
  FaultVfs(const FaultVfs&) = delete;
  FaultVfs& operator=(const FaultVfs&) = delete;
  ~FaultVfs();

  /// Requests so far of the plan's kinds on its files, and how many of them failed.
  int Seen() const noexcept { return seen_; }
  int Failed() const noexcept { return failed_; }

  /// Ends the process now, as the plan says how.
  [[noreturn]] void Stop() const;

  // For the file system's side.

  /// The one that lives; null when there is none.
  static FaultVfs* Current() noexcept;

  /// Counts a request. Returns whether it has to fail; ends the process where the plan says so.
  /// `partly` is what is done of it all the same in either case.
  bool Fails(Request request, const char* path, const std::function<void()>& partly = {});
  /// The failure as a result code of SQLite's, and as an errno.
  int Code() const noexcept { return plan_.code; }
  int SystemError() const noexcept { return plan_.systemError; }

  // Keep up what a power loss leaves of the files. Directories last at once.
  void Touching(const char* path); ///< before the name may go to another file, or to none
  void Opened(const char* path);
  void Synced(const char* path); ///< a file or a directory
  void Deleted(const char* path);
  void Renamed(const char* from, const char* to);

private:
  /// What a power loss leaves of the content of files.
  using Files = std::map<std::string, std::shared_ptr<std::string>>;

  struct Registration;

  bool Concerns(const char* path) const;
  bool Follows(const char* path) const;
  void DirectorySynced(const std::string& path);

  FaultPlan plan_;
  int seen_ = 0;
  int failed_ = 0;
  Files files_;   ///< by the path that they have
  Files lasting_; ///< by the path that they had when their directory was last synced
  std::unique_ptr<Registration> registration_;
};

} // namespace orva::test
