#pragma once

#include "PhotoList.h"

#include "orvautil/FileDescriptor.h"

#include <optional>
#include <string>

namespace orva::zophotos {

/// STATE of an export of changes, and the files next to it, which have its name and a suffix:
///
///   STATE         the last feed that was delivered
///   STATE.next    a feed that may have been delivered in part; it follows STATE
///   STATE.new     being written to replace STATE
///   STATE.lock    locked while an export uses the others
class ExportState {
public:
  /// Locks the files. Throws Failure, with ExitStatus::Locked if another export uses them.
  explicit ExportState(const std::string& path);

  /// The feed that was delivered last; nothing if it is missing or damaged. Throws Failure.
  std::optional<PhotoListReader> Delivered() const { return Open(""); }

  /// The feed that is pending; nothing if it is missing, damaged or incomplete. Throws Failure.
  std::optional<PhotoListReader> Pending() const { return Open(NEXT); }

  /// Begins a feed, which is pending once it is finished, instead of the former one. Throws
  /// Failure.
  PhotoListWriter WritePending(const Feed& feed) const { return Write(NEXT, feed); }

  /// Removes a feed that could not be finished.
  void RemovePending() const noexcept { Remove(NEXT); }

  /// Waits until the disk has the names of the files. Throws Failure.
  void Synchronise() const;

  /// Makes the pending feed the delivered one. Throws Failure.
  void Deliver(const PhotoListReader& pending) const;

private:
  static constexpr const char* NEXT = ".next";

  /// Opens one of the files; none if it does not exist. Throws Failure.
  util::FileDescriptor OpenFile(const std::string& suffix, int flags) const;
  std::optional<PhotoListReader> Open(const std::string& suffix) const;
  PhotoListWriter Write(const std::string& suffix, const Feed& feed) const;
  /// Replaces STATE.
  void Rename(const std::string& suffix) const;
  void Remove(const std::string& suffix) const noexcept;
  [[noreturn]] void ThrowError(const std::string& what, const std::string& suffix) const;

  std::string path_;
  std::string name_; ///< in the directory
  util::FileDescriptor directory_;
  util::FileDescriptor lock_;
};

} // namespace orva::zophotos
