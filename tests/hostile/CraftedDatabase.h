#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace orva::test {

/// Bytes of a file as a test changes them, with SQLite's big-endian numbers.
class Bytes {
public:
  Bytes() = default;
  explicit Bytes(std::vector<std::uint8_t> bytes) : bytes_(std::move(bytes)) {}

  /// The content of a file. Throws std::runtime_error when it cannot be read.
  static Bytes Of(const std::string& path);
  /// Makes or overwrites a file with this content.
  void Save(const std::string& path) const;

  std::size_t Size() const { return bytes_.size(); }
  void Resize(std::size_t size) { bytes_.resize(size); }
  std::uint8_t& operator[](std::size_t offset) { return bytes_.at(offset); }

  std::uint32_t Read(std::size_t offset, std::size_t width) const;
  void Write(std::size_t offset, std::size_t width, std::uint32_t value);

  void Append(std::uint32_t value);
  void Append(const std::string& text);
  void Append(const Bytes& other);
  Bytes Part(std::size_t offset, std::size_t size) const;

private:
  std::vector<std::uint8_t> bytes_;
};

/// An SQLite file whose pages a test changes without SQLite. Pages count from 1.
class CraftedDatabase {
public:
  /// Loads the file, which is not open and has no log.
  explicit CraftedDatabase(const std::string& path);

  std::uint32_t PageSize() const { return pageSize_; }
  std::uint32_t Pages() const { return static_cast<std::uint32_t>(file_.Size() / pageSize_); }

  /// The number of cells on a b-tree page.
  std::uint32_t Cells(std::uint32_t page) const;

  /// Replaces the cells of a leaf with as many pointers to its cell `index` as fit.
  void RepeatCell(std::uint32_t page, std::uint32_t index);

  /// Puts `levels` levels of interior pages above the content of the root page. All cells of a
  /// level point to the same page, so that the tree has its content many times over.
  void Multiply(std::uint32_t root, unsigned levels);

  /// The same with the root's content once, followed by many times `repeated`, a leaf page.
  void MultiplyAfter(std::uint32_t root, std::uint32_t repeated, unsigned levels);

  /// A new page with a copy of another page's content, which on the first page begins after the
  /// file's header.
  std::uint32_t CopyOf(std::uint32_t page);

  /// Sets the rightmost pointer of an interior page.
  void SetRightChild(std::uint32_t page, std::uint32_t child);

  Bytes& File() { return file_; }
  /// Offset of a page, and of its b-tree header, in the file.
  std::size_t Offset(std::uint32_t page) const { return std::size_t{page - 1} * pageSize_; }
  std::size_t Header(std::uint32_t page) const;

  /// Writes the file, with the right page count in its header.
  void Save();

private:
  std::uint32_t NewPage();
  void MakeInterior(std::uint32_t page, std::uint32_t first, std::uint32_t repeated,
                    std::uint32_t last);
  std::uint32_t MostCells() const { return (pageSize_ - 8) / 6; }

  std::string path_;
  Bytes file_;
  std::uint32_t pageSize_;
};

} // namespace orva::test
