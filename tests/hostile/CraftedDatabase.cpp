#include "CraftedDatabase.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace orva::test {

namespace {

constexpr std::size_t FILE_HEADER = 100;
constexpr std::uint8_t TABLE_LEAF = 13;
constexpr std::uint8_t TABLE_INTERIOR = 5;
constexpr std::size_t LEAF_HEADER = 8;
constexpr std::size_t INTERIOR_HEADER = 12;

} // namespace

Bytes Bytes::Of(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) {
    throw std::runtime_error("cannot read " + path);
  }
  return Bytes(std::vector<std::uint8_t>(std::istreambuf_iterator<char>(file), {}));
}

void Bytes::Save(const std::string& path) const {
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file.write(reinterpret_cast<const char*>(bytes_.data()),
             static_cast<std::streamsize>(bytes_.size()));
}

std::uint32_t Bytes::Read(std::size_t offset, std::size_t width) const {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < width; ++i) {
    value = (value << 8U) | bytes_.at(offset + i);
  }
  return value;
}

void Bytes::Write(std::size_t offset, std::size_t width, std::uint32_t value) {
  for (std::size_t i = width; i-- > 0; value >>= 8U) {
    bytes_.at(offset + i) = static_cast<std::uint8_t>(value);
  }
}

void Bytes::Append(std::uint32_t value) {
  bytes_.resize(bytes_.size() + 4);
  Write(bytes_.size() - 4, 4, value);
}

void Bytes::Append(const std::string& text) {
  bytes_.insert(bytes_.end(), text.begin(), text.end());
}

void Bytes::Append(const Bytes& other) {
  bytes_.insert(bytes_.end(), other.bytes_.begin(), other.bytes_.end());
}

Bytes Bytes::Part(std::size_t offset, std::size_t size) const {
  const auto begin = bytes_.begin() + static_cast<std::ptrdiff_t>(offset);
  return Bytes({begin, begin + static_cast<std::ptrdiff_t>(size)});
}

CraftedDatabase::CraftedDatabase(const std::string& path)
    : path_(path), file_(Bytes::Of(path)), pageSize_(file_.Read(16, 2)) {
  // 1 stands for 65536, which does not fit the field.
  pageSize_ = pageSize_ == 1 ? 65536 : pageSize_;
}

std::size_t CraftedDatabase::Header(std::uint32_t page) const {
  return Offset(page) + (page == 1 ? FILE_HEADER : 0);
}

std::uint32_t CraftedDatabase::Cells(std::uint32_t page) const {
  return file_.Read(Header(page) + 3, 2);
}

void CraftedDatabase::RepeatCell(std::uint32_t page, std::uint32_t index) {
  const std::size_t pointers = Header(page) + LEAF_HEADER;
  const std::uint32_t cell = file_.Read(pointers + std::size_t{index} * 2, 2);
  // The pointers end where the cell begins.
  const std::size_t room = (Offset(page) + cell - pointers) / 2;
  const auto count = static_cast<std::uint32_t>(std::min<std::size_t>(room, MostCells()));
  file_.Write(Header(page) + 1, 2, 0);
  file_.Write(Header(page) + 3, 2, count);
  file_.Write(Header(page) + 5, 2, cell);
  file_.Write(Header(page) + 7, 1, 0);
  for (std::uint32_t i = 0; i < count; ++i) {
    file_.Write(pointers + std::size_t{i} * 2, 2, cell);
  }
}

void CraftedDatabase::Multiply(std::uint32_t root, unsigned levels) {
  MultiplyAfter(root, CopyOf(root), levels);
}

void CraftedDatabase::MultiplyAfter(std::uint32_t root, std::uint32_t repeated, unsigned levels) {
  const std::uint32_t original = CopyOf(root);
  std::uint32_t child = repeated;
  for (unsigned level = 1; level < levels; ++level) {
    const std::uint32_t page = NewPage();
    MakeInterior(page, child, child, child);
    child = page;
  }
  MakeInterior(root, original, child, child);
}

std::uint32_t CraftedDatabase::CopyOf(std::uint32_t page) {
  const std::uint32_t copy = NewPage();
  const std::size_t shift = Header(page) - Offset(page);
  const std::size_t size = pageSize_ - shift;
  const Bytes content = file_.Part(Header(page), size);
  if (shift == 0) {
    for (std::size_t i = 0; i < size; ++i) {
      file_[Offset(copy) + i] = content.Read(i, 1) & 0xffU;
    }
    return copy;
  }
  // The cells keep their offsets, and the page's header moves to the beginning.
  for (std::size_t i = 0; i < pageSize_; ++i) {
    file_[Offset(copy) + i] = file_[Offset(page) + i];
  }
  const std::size_t front = (content.Read(0, 1) == TABLE_LEAF ? LEAF_HEADER : INTERIOR_HEADER) +
                            std::size_t{content.Read(3, 2)} * 2;
  for (std::size_t i = 0; i < front; ++i) {
    file_[Offset(copy) + i] = content.Read(i, 1) & 0xffU;
  }
  return copy;
}

void CraftedDatabase::SetRightChild(std::uint32_t page, std::uint32_t child) {
  file_.Write(Header(page) + 8, 4, child);
}

void CraftedDatabase::Save() {
  file_.Write(28, 4, Pages());
  // The page count is valid for this change counter.
  file_.Write(92, 4, file_.Read(24, 4));
  file_.Save(path_);
}

std::uint32_t CraftedDatabase::NewPage() {
  file_.Resize(file_.Size() + pageSize_);
  return Pages();
}

void CraftedDatabase::MakeInterior(std::uint32_t page, std::uint32_t first, std::uint32_t repeated,
                                   std::uint32_t last) {
  constexpr std::uint32_t cellSize = 13; // a child and the longest number
  const std::uint32_t firstCell = pageSize_ - cellSize;
  const std::uint32_t otherCell = pageSize_ - 2 * cellSize;
  for (const auto& [cell, child] : {std::pair(firstCell, first), std::pair(otherCell, repeated)}) {
    file_.Write(Offset(page) + cell, 4, child);
    file_.Write(Offset(page) + cell + 4, 1, 0x7f); // a key after those that tests use
  }
  const std::size_t header = Header(page);
  const std::size_t pointers = header + INTERIOR_HEADER;
  const std::size_t room = (Offset(page) + otherCell - pointers) / 2;
  const auto count = static_cast<std::uint32_t>(std::min<std::size_t>(room, MostCells()));
  file_.Write(header, 1, TABLE_INTERIOR);
  file_.Write(header + 1, 2, 0);
  file_.Write(header + 3, 2, count);
  file_.Write(header + 5, 2, otherCell);
  file_.Write(header + 7, 1, 0);
  file_.Write(header + 8, 4, last);
  for (std::uint32_t i = 0; i < count; ++i) {
    file_.Write(pointers + std::size_t{i} * 2, 2, i == 0 ? firstCell : otherCell);
  }
}

} // namespace orva::test
