#pragma once

#include <cerrno>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// A request to the file system, by SQLite or by the daemon itself.
enum class Request { Open, Read, Write, Sync, Truncate, Size, Lock, Delete, Access, Rename };

/// Which request of an operation fails, and how.
struct FaultPlan {
  enum class Effect {
    Error,    ///< the request fails with `code`
    Crash,    ///< the process ends there
    PowerLoss ///< the same, and files have the content that they had when last synced
  };

  std::string files;               ///< a part of the paths of the files concerned
  std::vector<Request> requests{}; ///< the kinds concerned
  int nth = 0;                     ///< the one that fails, counted from 1; 0 for none
  Effect effect = Effect::Error;
  int code = 0;           ///< SQLite's result code for an Error
  bool permanent = false; ///< an Error of all following requests too
  int systemError = EIO;  ///< errno of an Error of the daemon's own requests
  std::string lost{};     ///< a part of the paths of the files whose content a PowerLoss loses
  /// A PowerLoss undoes every creation, renaming and deletion since the directory was last synced.
  bool losesNames = false;
};

/// SQLite's file system with a fault, for as long as the object lives: the default of connections
/// that are opened in that time, which must be closed before the object ends. One object at a time,
/// on the thread that uses SQLite. A write that fails writes its first half; waiting for a lock
/// takes no time.
class FaultVfs {
public:
  /// Exit status of a process that a plan has ended.
  static constexpr int CRASHED = 86;

  explicit FaultVfs(FaultPlan plan);
  FaultVfs(const FaultVfs&) = delete;
  FaultVfs& operator=(const FaultVfs&) = delete;
  ~FaultVfs();

  /// Requests so far of the plan's kinds on its files, and how many of them failed.
  int Seen() const noexcept { return seen_; }
  int Failed() const noexcept { return failed_; }

  /// Ends the process now, with or without a loss of power according to the plan.
  [[noreturn]] void Crash() const;

  // For the file system's side.

  /// Whether SQLite is deleting a file, which it does through the daemon's code.
  bool IsDeleting() const noexcept { return deleting_; }
  void SetDeleting(bool deleting) noexcept { deleting_ = deleting; }

  /// The existing object; null when there is none.
  static FaultVfs* Current() noexcept;

  /// Counts a request. Returns whether it has to fail, or ends the process, according to the plan;
  /// in both cases after `partly`, which does a part of the request.
  bool Fails(Request request, const char* path, const std::function<void()>& partly = {});
  /// The failure as a result code of SQLite's, and as an errno.
  int Code() const noexcept { return plan_.code; }
  int SystemError() const noexcept { return plan_.systemError; }

  // These record what a power loss leaves of the files. New directories are never lost.
  void Touching(const char* path); ///< before a file is opened, replaced or removed
  void Opened(const char* path);
  void Synced(const char* path); ///< a file or a directory
  void Deleted(const char* path);
  void Renamed(const char* from, const char* to);

private:
  /// The content of files after a power loss.
  using Files = std::map<std::string, std::shared_ptr<std::string>>;

  struct Registration;

  bool Concerns(const char* path) const;
  bool Follows(const char* path) const;
  void DirectorySynced(const std::string& path);

  FaultPlan plan_;
  bool deleting_ = false;
  int seen_ = 0;
  int failed_ = 0;
  Files files_;   ///< by the path that they have
  Files lasting_; ///< by the path that they had when their directory was last synced
  std::unique_ptr<Registration> registration_;
};

} // namespace orva::test
