#include "PhotoList.h"

#include "Failure.h"

#include <sys/stat.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <string_view>
#include <utility>

namespace orva::zophotos {

namespace {

/// The beginning of each file. Its last character is the version of the format.
constexpr std::string_view MAGIC = "zophotos feed 1\n";
/// Magic, flags, number, id, previous, time, database.
constexpr std::size_t HEADER_SIZE = MAGIC.size() + 8 + 8 + 16 + 16 + 8 + 8 + 8 + 8;
/// Number of photos, checksum.
constexpr std::size_t TRAILER_SIZE = 8 + 4;
constexpr std::size_t CHECKSUM_SIZE = 4;
/// The photos are in blocks of two parts, the numbers and the texts. Two sizes are before each
/// part: its own, and that of its bytes in the file. They are compressed if the second one is
/// smaller.
constexpr std::size_t PART_HEADER_SIZE = 8 + 8;
/// A block ends with the photo that reaches this size.
constexpr std::size_t BLOCK_SIZE = 65536;

/// Photos that take so many bytes on average are not compressed, because that would take longer
/// than to write them.
constexpr std::size_t SMALL_PHOTO = 20;
/// No data can be compressed better than by this factor.
constexpr std::uint64_t BEST_COMPRESSION = 1032;

constexpr std::uint64_t WHOLE = 1;
constexpr std::uint64_t PHOTOS = 2;

/// Appends the lowest `size` bytes of a number, the lowest first.
void PutFixed(std::string& bytes, std::uint64_t number, std::size_t size = 8) {
  for (; size > 0; --size, number >>= 8U) {
    bytes += static_cast<char>(number & 0xFFU);
  }
}

/// Removes a number of PutFixed from the beginning of `bytes`.
std::uint64_t TakeFixed(std::string_view& bytes, std::size_t size = 8) {
  std::uint64_t number = 0;
  for (std::size_t i = 0; i < size; ++i) {
    number |= static_cast<std::uint64_t>(static_cast<unsigned char>(bytes[i])) << (8 * i);
  }
  bytes.remove_prefix(size);
  return number;
}

void PutId(std::string& bytes, const FeedId& id) {
  bytes.append(id.data(), id.size());
}

FeedId TakeId(std::string_view& bytes) {
  FeedId id{};
  bytes.copy(id.data(), id.size());
  bytes.remove_prefix(id.size());
  return id;
}

/// Appends a number in groups of seven bits, so that small numbers take one byte.
void PutNumber(std::string& bytes, std::uint64_t number) {
  for (; number >= 0x80U; number >>= 7U) {
    bytes += static_cast<char>(number | 0x80U);
  }
  bytes += static_cast<char>(number);
}

/// Appends the difference of two times, so that differences near 0 of both signs take one byte. It
/// is calculated modulo 2^64: a crafted database can have any times.
void PutDifference(std::string& bytes, std::int64_t time, std::int64_t from) {
  const std::uint64_t difference =
      static_cast<std::uint64_t>(time) - static_cast<std::uint64_t>(from);
  const std::uint64_t sign = difference >> 63U;
  PutNumber(bytes, (difference << 1U) ^ (0 - sign));
}

std::size_t CommonPrefix(std::string_view a, std::string_view b) {
  return static_cast<std::size_t>(std::mismatch(a.begin(), a.end(), b.begin(), b.end()).first -
                                  a.begin());
}

std::size_t CommonSuffix(std::string_view a, std::string_view b) {
  return static_cast<std::size_t>(std::mismatch(a.rbegin(), a.rend(), b.rbegin(), b.rend()).first -
                                  a.rbegin());
}

std::string HeaderBytes(const Feed& feed) {
  std::string bytes(MAGIC);
  PutFixed(bytes, (feed.isWhole ? WHOLE : 0) | (feed.hasPhotos ? PHOTOS : 0));
  PutFixed(bytes, feed.number);
  PutId(bytes, feed.id);
  PutId(bytes, feed.previous);
  PutFixed(bytes, static_cast<std::uint64_t>(feed.time));
  PutFixed(bytes, feed.database.file);
  PutFixed(bytes, static_cast<std::uint64_t>(feed.database.emptied));
  PutFixed(bytes, static_cast<std::uint64_t>(feed.database.lastId));
  return bytes;
}

Feed ParseHeader(std::string_view bytes) {
  bytes.remove_prefix(MAGIC.size());
  Feed feed;
  const std::uint64_t flags = TakeFixed(bytes);
  feed.isWhole = (flags & WHOLE) != 0;
  feed.hasPhotos = (flags & PHOTOS) != 0;
  feed.number = TakeFixed(bytes);
  feed.id = TakeId(bytes);
  feed.previous = TakeId(bytes);
  feed.time = static_cast<std::int64_t>(TakeFixed(bytes));
  feed.database.file = TakeFixed(bytes);
  feed.database.emptied = static_cast<std::int64_t>(TakeFixed(bytes));
  feed.database.lastId = static_cast<std::int64_t>(TakeFixed(bytes));
  return feed;
}

Bytef* Unsigned(char* bytes) {
  return reinterpret_cast<Bytef*>(bytes);
}

std::string Deflate(std::string& bytes, int strategy) {
  // zlib's fastest level. Higher ones take three times as long to save a tenth.
  constexpr int level = 1;
  constexpr int memoryLevel = 8;
  z_stream stream{};
  if (deflateInit2(&stream, level, Z_DEFLATED, MAX_WBITS, memoryLevel, strategy) != Z_OK) {
    throw std::bad_alloc();
  }
  std::string compressed(deflateBound(&stream, bytes.size()), '\0');
  // SQLite has no texts that are larger than these numbers.
  stream.next_in = Unsigned(bytes.data());
  stream.avail_in = static_cast<uInt>(bytes.size());
  stream.next_out = Unsigned(compressed.data());
  stream.avail_out = static_cast<uInt>(compressed.size());
  deflate(&stream, Z_FINISH);
  compressed.resize(stream.total_out);
  deflateEnd(&stream);
  return compressed;
}

/// The smaller result of two strategies. Random names, as in UUIDs, have no repeated texts.
std::string Compress(std::string& bytes) {
  std::string repeated = Deflate(bytes, Z_DEFAULT_STRATEGY);
  std::string random = Deflate(bytes, Z_HUFFMAN_ONLY);
  return random.size() < repeated.size() ? random : repeated;
}

std::uint32_t Checksum(std::uint32_t before, std::string_view bytes) {
  return static_cast<std::uint32_t>(
      crc32_z(before, reinterpret_cast<const Bytef*>(bytes.data()), bytes.size()));
}

} // namespace

PhotoListWriter::PhotoListWriter(util::FileDescriptor file, std::string name, const Feed& feed)
    : file_(std::move(file)), name_(std::move(name)) {
  Write(HeaderBytes(feed));
}

void PhotoListWriter::Add(const Photo& photo) {
  const std::string_view last = photo_.path;
  const std::string_view path = photo.path;
  const std::size_t prefix = CommonPrefix(last, path);
  const std::size_t suffix = CommonSuffix(last.substr(prefix), path.substr(prefix));
  const std::size_t middle = path.size() - prefix - suffix;
  PutNumber(numbers_, prefix);
  PutNumber(numbers_, suffix);
  PutNumber(numbers_, middle);
  texts_ += path.substr(prefix, middle);
  if (photo.volume == photo_.volume) {
    PutNumber(numbers_, 0);
  } else {
    PutNumber(numbers_, photo.volume.size() + 1);
    texts_ += photo.volume;
  }
  PutDifference(numbers_, photo.modified, photo_.modified);
  PutDifference(numbers_, photo.created, photo.modified);
  photo_ = photo;
  ++photos_;
  ++photosInBlock_;
  if (numbers_.size() + texts_.size() >= BLOCK_SIZE) {
    WriteBlock();
  }
}

void PhotoListWriter::Finish() {
  if (photosInBlock_ > 0) {
    WriteBlock();
  }
  std::string trailer;
  PutFixed(trailer, photos_);
  Write(trailer);
  trailer.clear();
  PutFixed(trailer, checksum_, CHECKSUM_SIZE);
  Write(trailer);
  if (fsync(file_.Get()) != 0) {
    throw Failure(ExitStatus::Failed, "cannot write " + name_ + ": " + std::strerror(errno));
  }
}

void PhotoListWriter::WriteBlock() {
  const bool isLarge = numbers_.size() + texts_.size() > photosInBlock_ * SMALL_PHOTO;
  for (std::string* const part : {&numbers_, &texts_}) {
    const std::string compressed = isLarge ? Compress(*part) : *part;
    const std::string& bytes = compressed.size() < part->size() ? compressed : *part;
    std::string header;
    PutFixed(header, part->size());
    PutFixed(header, bytes.size());
    Write(header);
    Write(bytes);
    part->clear();
  }
  photosInBlock_ = 0;
}

void PhotoListWriter::Write(std::string_view bytes) {
  checksum_ = Checksum(checksum_, bytes);
  while (!bytes.empty()) {
    const ssize_t count = write(file_.Get(), bytes.data(), bytes.size());
    if (count > 0) {
      bytes.remove_prefix(static_cast<std::size_t>(count));
    } else if (errno != EINTR) {
      throw Failure(ExitStatus::Failed, "cannot write " + name_ + ": " + std::strerror(errno));
    }
  }
}

std::optional<PhotoListReader> PhotoListReader::Open(util::FileDescriptor file, std::string name) {
  PhotoListReader reader(std::move(file), std::move(name));
  if (!reader.Check()) {
    return std::nullopt;
  }
  return reader;
}

PhotoListReader::PhotoListReader(util::FileDescriptor file, std::string name)
    : file_(std::move(file)), name_(std::move(name)) {}

bool PhotoListReader::Check() {
  struct stat status {};
  if (fstat(file_.Get(), &status) != 0) {
    throw Failure(ExitStatus::Failed, "cannot read " + name_ + ": " + std::strerror(errno));
  }
  size_ = static_cast<std::uint64_t>(status.st_size);
  if (size_ < HEADER_SIZE + TRAILER_SIZE) {
    return false;
  }
  std::uint32_t checksum = 0;
  const std::uint64_t end = size_ - CHECKSUM_SIZE;
  for (std::uint64_t offset = 0; offset < end;) {
    const std::string_view bytes = Read(offset, std::min<std::uint64_t>(BLOCK_SIZE, end - offset));
    if (bytes.empty()) {
      return false; // it became shorter
    }
    checksum = Checksum(checksum, bytes);
    offset += bytes.size();
  }
  const std::string_view header = Read(0, HEADER_SIZE);
  if (header.size() != HEADER_SIZE || !header.starts_with(MAGIC)) {
    return false;
  }
  feed_ = ParseHeader(header);
  offset_ = HEADER_SIZE;
  std::string_view trailer = Read(size_ - TRAILER_SIZE, TRAILER_SIZE);
  if (trailer.size() != TRAILER_SIZE) {
    return false;
  }
  photos_ = TakeFixed(trailer);
  left_ = photos_;
  return TakeFixed(trailer, CHECKSUM_SIZE) == checksum;
}

const Photo* PhotoListReader::Next() {
  if (left_ == 0) {
    return nullptr;
  }
  --left_;
  if (numbers_.IsAtEnd()) {
    ReadPart(numbers_);
    ReadPart(texts_);
  }
  const std::uint64_t prefix = Number();
  const std::uint64_t suffix = Number();
  if (prefix > photo_.path.size() || suffix > photo_.path.size() - prefix) {
    ThrowDamaged();
  }
  photo_.path.replace(prefix, photo_.path.size() - prefix - suffix, Text(Number()));
  const std::uint64_t volume = Number();
  if (volume > 0) {
    photo_.volume = Text(volume - 1);
  }
  photo_.modified = TakeTime(photo_.modified);
  photo_.created = TakeTime(photo_.modified);
  return &photo_;
}

std::string_view PhotoListReader::Read(std::uint64_t offset, std::uint64_t size) {
  buffer_.resize(size);
  std::size_t done = 0;
  while (done < size) {
    const ssize_t count =
        pread(file_.Get(), buffer_.data() + done, size - done, static_cast<off_t>(offset + done));
    if (count == 0) {
      break;
    }
    if (count > 0) {
      done += static_cast<std::size_t>(count);
    } else if (errno != EINTR) {
      throw Failure(ExitStatus::Failed, "cannot read " + name_ + ": " + std::strerror(errno));
    }
  }
  return std::string_view(buffer_).substr(0, done);
}

void PhotoListReader::ReadPart(Part& part) {
  const std::uint64_t end = size_ - TRAILER_SIZE;
  std::string_view header = Read(offset_, std::min<std::uint64_t>(PART_HEADER_SIZE, end - offset_));
  if (header.size() != PART_HEADER_SIZE) {
    ThrowDamaged();
  }
  offset_ += PART_HEADER_SIZE;
  const std::uint64_t size = TakeFixed(header);
  const std::uint64_t stored = TakeFixed(header);
  if (stored > end - offset_ || size < stored || size / BEST_COMPRESSION > stored ||
      Read(offset_, stored).size() != stored) {
    ThrowDamaged();
  }
  offset_ += stored;
  part.position = 0;
  if (stored == size) {
    part.bytes = buffer_;
    return;
  }
  part.bytes.resize(size);
  uLongf result = size;
  if (uncompress(Unsigned(part.bytes.data()), &result, Unsigned(buffer_.data()), stored) != Z_OK ||
      result != size) {
    ThrowDamaged();
  }
}

void PhotoListReader::ThrowDamaged() const {
  throw Failure(ExitStatus::Failed, name_ + " is damaged; remove it");
}

std::uint64_t PhotoListReader::Number() {
  std::uint64_t number = 0;
  for (unsigned shift = 0; shift < 64; shift += 7) {
    if (numbers_.IsAtEnd()) {
      ThrowDamaged();
    }
    const auto byte = static_cast<unsigned char>(numbers_.bytes[numbers_.position++]);
    number |= static_cast<std::uint64_t>(byte & 0x7FU) << shift;
    if (byte < 0x80U) {
      return number;
    }
  }
  ThrowDamaged();
}

std::int64_t PhotoListReader::TakeTime(std::int64_t from) {
  const std::uint64_t number = Number();
  const std::uint64_t difference = (number >> 1U) ^ (0 - (number & 1U));
  return static_cast<std::int64_t>(static_cast<std::uint64_t>(from) + difference);
}

std::string_view PhotoListReader::Text(std::uint64_t size) {
  if (size > texts_.bytes.size() - texts_.position) {
    ThrowDamaged();
  }
  const std::string_view text = std::string_view(texts_.bytes).substr(texts_.position, size);
  texts_.position += size;
  return text;
}

} // namespace orva::zophotos
