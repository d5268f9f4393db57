#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace orva::transcoder {

/// The folders of one batch, in memory: `in` with copies of the photos, which the sandbox may read,
/// and `out` with a file for each photo, which it may write; it cannot create others. The names of
/// the files are numbers, so that no program sees a name of a volume. Removed with the object. Used
/// by one thread at a time.
class StagingFolder {
public:
  /// Makes the folder, which does not exist. Throws util::Exception.
  explicit StagingFolder(std::string path);
  StagingFolder(StagingFolder&& other) noexcept;
  StagingFolder& operator=(StagingFolder&&) = delete;
  StagingFolder(const StagingFolder&) = delete;
  StagingFolder& operator=(const StagingFolder&) = delete;
  ~StagingFolder();

  std::string Input() const { return path_ + "/in"; }
  std::string Output() const { return path_ + "/out"; }

  /// Makes the files of the photo `number`, both empty. Returns the one in `in`, to fill it. Throws
  /// util::Exception.
  util::FileDescriptor Add(std::size_t number) const;

  /// Removes the files of the photo `number`.
  void Remove(std::size_t number) const;

  /// Whether the photo's file in `in` contains `text`; true if it cannot be read.
  bool InputContains(std::size_t number, std::string_view text) const;

  /// Opens the photo's file in `out` for reading. Returns no descriptor if it is not a regular
  /// file.
  util::FileDescriptor OpenOutput(std::size_t number) const;

  /// Makes the output of the photo `number` its input, and its output empty again. Throws
  /// util::Exception.
  void UseOutputAsInput(std::size_t number) const;

private:
  std::string path_;
};

/// Makes `path` an empty folder that other users cannot look into, except the sandbox. It may be a
/// mount point. What an earlier run left there is removed. Throws util::Exception.
void PrepareStaging(const std::string& path);

/// Bytes in the file system of a staging folder. A quarter of it stays free of copies: for what the
/// sandbox writes, and for other programs if the file system is shared.
struct StagingSpace {
  long long now = 0;  ///< that copies may take at this moment
  long long most = 0; ///< that copies may ever take
};

/// Throws util::Exception.
StagingSpace SpaceFor(const std::string& path);

} // namespace orva::transcoder
