#pragma once

#include "Photo.h"

#include "orvautil/FileDescriptor.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace orva::zophotos {

/// Identifies a feed; zeros stand for none.
using FeedId = std::array<char, 16>;

/// Tells one merged database from another one.
struct DatabaseIdentity {
  std::uint64_t file = 0;   ///< a hash of its path, its inode and when the inode was made
  std::int64_t emptied = 0; ///< when it was last emptied
  std::int64_t lastId = 0;  ///< the largest id of a file so far; never decreases
};

/// A feed: the photos of a merged database at one time, and which feed came before.
struct Feed {
  std::uint64_t number = 0;
  FeedId id{};
  FeedId previous{};     ///< the feed that was remembered when this one was made
  bool isWhole = true;   ///< it holds all photos, not the changes since `previous`
  bool hasPhotos = true; ///< the list holds the photos; false if they take too much space
  std::int64_t time = 0; ///< when the database was read
  DatabaseIdentity database{};
};

/// Writes the file of a feed: a header with a version, the photos in blocks, and a trailer with
/// their number and a checksum of the file. A file whose writer was killed has no valid checksum.
class PhotoListWriter {
public:
  /// Writes to `file`, an empty file. Messages call it `name`. Throws Failure.
  PhotoListWriter(util::FileDescriptor file, std::string name, const Feed& feed);

  /// Adds a photo. Photos with similar paths that follow each other take little space. Throws
  /// Failure.
  void Add(const Photo& photo);

  /// Completes the file, and waits until the disk has it. Throws Failure.
  void Finish();

private:
  void WriteBlock();
  void Write(std::string_view bytes);

  util::FileDescriptor file_;
  std::string name_;
  // The photos that were added last.
  std::string numbers_;
  std::string texts_;
  std::size_t photosInBlock_ = 0;
  std::uint64_t photos_ = 0;
  std::uint32_t checksum_ = 0;
  Photo photo_; ///< the last one
};

/// Reads what PhotoListWriter wrote, in constant memory.
class PhotoListReader {
public:
  /// Reads `file` once to check it. Returns nothing if it is damaged, cut off or of another
  /// version. Messages call it `name`. Throws Failure.
  static std::optional<PhotoListReader> Open(util::FileDescriptor file, std::string name);

  const Feed& Header() const { return feed_; }
  std::uint64_t Photos() const { return photos_; }
  /// The size of the file in bytes.
  std::uint64_t Size() const { return size_; }

  /// Reads the next photo; null after the last one. It is valid until the next call. Throws
  /// Failure.
  const Photo* Next();

private:
  /// A part of a block.
  struct Part {
    std::string bytes;
    std::size_t position = 0;

    bool IsAtEnd() const { return position == bytes.size(); }
  };

  PhotoListReader(util::FileDescriptor file, std::string name);

  /// Whether the file has a valid header, trailer and checksum.
  bool Check();
  /// Reads the bytes at `offset`; fewer at the end of the file. They are valid until the next call.
  std::string_view Read(std::uint64_t offset, std::uint64_t size);
  void ReadPart(Part& part);
  [[noreturn]] void ThrowDamaged() const;
  std::uint64_t Number();
  /// Reads a time that is stored as the difference from another one.
  std::int64_t TakeTime(std::int64_t from);
  /// The next text; valid until the next part is read.
  std::string_view Text(std::uint64_t size);

  util::FileDescriptor file_;
  std::string name_;
  Feed feed_;
  std::uint64_t photos_ = 0;
  std::uint64_t size_ = 0;
  std::uint64_t left_ = 0;   ///< photos that were not read yet
  std::uint64_t offset_ = 0; ///< of the next block
  std::string buffer_;       ///< bytes of the file
  Part numbers_;
  Part texts_;
  Photo photo_; ///< the last one
};

} // namespace orva::zophotos
