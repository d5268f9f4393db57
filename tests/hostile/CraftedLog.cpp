#include "CraftedLog.h"

namespace orva::test {

namespace {

constexpr std::uint32_t SECTOR = 512;
constexpr std::uint32_t NONCE = 0x5eed;
constexpr std::size_t CHECKED_EVERY = 200;
constexpr std::uint32_t LOCK_BYTE = 0x40000000;

void AppendMagic(Bytes& journal) {
  journal.Append(0xd9d505f9U);
  journal.Append(0x20a163d7U);
}

std::uint32_t JournalChecksum(const Bytes& page) {
  std::uint32_t sum = NONCE;
  for (std::size_t at = page.Size() - CHECKED_EVERY; at > 0 && at < page.Size();
       at -= CHECKED_EVERY) {
    sum += page.Read(at, 1);
  }
  return sum;
}

/// The running checksum of a write-ahead log.
class WalChecksum {
public:
  void Add(const Bytes& bytes) {
    for (std::size_t at = 0; at < bytes.Size(); at += 8) {
      first_ += bytes.Read(at, 4) + second_;
      second_ += bytes.Read(at + 4, 4) + first_;
    }
  }
  void AppendTo(Bytes& wal) const {
    wal.Append(first_);
    wal.Append(second_);
  }

private:
  std::uint32_t first_ = 0;
  std::uint32_t second_ = 0;
};

} // namespace

Bytes CraftedJournal(std::uint32_t pageSize, std::uint32_t pageCount,
                     const std::map<std::uint32_t, Bytes>& pages, const std::string& superJournal) {
  Bytes journal;
  AppendMagic(journal);
  for (const std::uint32_t word :
       {static_cast<std::uint32_t>(pages.size()), NONCE, pageCount, SECTOR, pageSize}) {
    journal.Append(word);
  }
  journal.Resize(SECTOR);
  for (const auto& [number, page] : pages) {
    journal.Append(number);
    journal.Append(page);
    journal.Append(JournalChecksum(page));
  }
  if (!superJournal.empty()) {
    journal.Append(LOCK_BYTE / pageSize + 1);
    journal.Append(superJournal);
    std::uint32_t sum = 0;
    for (const char byte : superJournal) {
      sum += static_cast<std::uint32_t>(static_cast<std::int32_t>(byte));
    }
    journal.Append(static_cast<std::uint32_t>(superJournal.size()));
    journal.Append(sum);
    AppendMagic(journal);
  }
  return journal;
}

Bytes CraftedWal(std::uint32_t pageSize, std::uint32_t pageCount,
                 const std::map<std::uint32_t, Bytes>& pages) {
  constexpr std::uint32_t bigEndianMagic = 0x377f0683;
  constexpr std::uint32_t version = 3007000;
  constexpr std::uint32_t salt = 0x5a175a17;
  Bytes wal;
  for (const std::uint32_t word : {bigEndianMagic, version, pageSize, 0U, salt, salt}) {
    wal.Append(word);
  }
  WalChecksum checksum;
  checksum.Add(wal);
  checksum.AppendTo(wal);
  std::size_t left = pages.size();
  for (const auto& [number, page] : pages) {
    Bytes head;
    head.Append(number);
    head.Append(--left == 0 ? pageCount : 0U);
    checksum.Add(head);
    checksum.Add(page);
    wal.Append(head);
    wal.Append(salt);
    wal.Append(salt);
    checksum.AppendTo(wal);
    wal.Append(page);
  }
  return wal;
}

} // namespace orva::test
