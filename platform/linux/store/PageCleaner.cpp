#include "platform/linux/store/PageCleaner.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <optional>
#include <span>

#include "platform/linux/store/StoreSpace.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kPasses = 2;
// A step reads this many pages, which takes some milliseconds. Waiting records must not be held up
// for long, and each step syncs the database.
constexpr std::uint32_t kPagesPerStep = 2048;

// https://www.sqlite.org/fileformat2.html
constexpr std::size_t kFirstTrunkAt = 32;        // in the first page: the list of free pages
constexpr std::size_t kFileHeader = 100;         // before the tree in the first page
constexpr std::uint32_t kLockByte = 0x40000000;  // SQLite uses no page that has it
constexpr std::uint32_t kMapEntry = 5;
enum MapType : unsigned char { kRoot = 1, kTree = 5 };
enum TreeType : unsigned char {
  kIndexInner = 2,
  kTableInner = 5,
  kIndexLeaf = 10,
  kTableLeaf = 13
};

using Bytes = std::span<const unsigned char>;

std::uint32_t number16(Bytes bytes, std::size_t at) {
  return static_cast<std::uint32_t>(bytes[at]) << 8U | bytes[at + 1];
}

std::uint32_t number32(Bytes bytes, std::size_t at) {
  return number16(bytes, at) << 16U | number16(bytes, at + 2);
}

// Reads a number of 1 to 9 bytes, of which the last one has 8 bits. Moves `at` after it.
std::optional<std::uint64_t> varint(Bytes bytes, std::size_t& at) {
  constexpr int kLongest = 9;
  std::uint64_t number = 0;
  for (int index = 1; at < bytes.size(); ++index) {
    const std::uint64_t byte = bytes[at++];
    if (index == kLongest) return number << 8U | byte;
    number = number << 7U | (byte & 0x7FU);
    if (byte < 0x80U) return number;
  }
  return std::nullopt;
}

// A cell of a tree, and the part of its payload that is in overflow pages.
struct Cell {
  std::size_t end = 0;
  std::uint32_t overflow = 0;  // the first page; 0 if there is none
  std::uint64_t overflowBytes = 0;
};

// Returns the cell that begins at `at`, or nothing if the page is damaged.
std::optional<Cell> cellAt(Bytes page, unsigned char type, std::size_t at) {
  constexpr std::size_t kLeast = 4;
  const std::size_t begin = at;
  if (type == kTableInner || type == kIndexInner) at += 4;
  std::uint64_t payload = 0;
  if (type == kTableInner) {
    if (!varint(page, at)) return std::nullopt;
    return Cell{.end = at};
  }
  const auto length = varint(page, at);
  if (!length || (type == kTableLeaf && !varint(page, at))) return std::nullopt;
  payload = *length;
  const std::uint64_t usable = page.size();
  const std::uint64_t most = type == kTableLeaf ? usable - 35 : (usable - 12) * 64 / 255 - 23;
  const std::uint64_t least = (usable - 12) * 32 / 255 - 23;
  if (payload <= most) {
    at += payload;
    if (at > page.size()) return std::nullopt;
    return Cell{.end = std::max(at, begin + kLeast)};
  }
  const std::uint64_t some = least + (payload - least) % (usable - 4);
  const std::uint64_t local = some <= most ? some : least;
  at += local;
  if (at + 4 > page.size()) return std::nullopt;
  return Cell{.end = at + 4, .overflow = number32(page, at), .overflowBytes = payload - local};
}

}  // namespace

bool PageCleaner::canClean(Database& database) {
  int reserved = -1;  // asks, and changes nothing
  return database.queryInteger("PRAGMA auto_vacuum").value_or(0) != 0 &&
         sqlite3_file_control(database.get(), "main", SQLITE_FCNTL_RESERVE_BYTES, &reserved) ==
             SQLITE_OK &&
         reserved == 0;
}

SqliteCode PageCleaner::cleanOnce(Database& database, bool& more, bool& isHeld) {
  more = true;
  SqliteCode code = emptyLog(database, isHeld);
  if (code != SQLITE_OK || isHeld) return code;
  // Keeps every other writer away. If one wrote after the log was emptied, the file is not
  // complete, and the next step tries again.
  code = database.execute("BEGIN IMMEDIATE");
  isHeld = (code & 0xFF) == SQLITE_BUSY;
  if (code != SQLITE_OK) return isHeld ? SQLITE_OK : code;
  if (logBytes(database_) == 0) code = cleanSome(database, more);
  const SqliteCode ended = database.execute("ROLLBACK");
  // The pages that SQLite keeps in memory have the bytes that were overwritten, and would bring
  // them back when they are written.
  sqlite3_db_release_memory(database.get());
  return code == SQLITE_OK ? ended : code;
}

SqliteCode PageCleaner::cleanSome(Database& database, bool& more) {
  SqliteCode code = sqlite3_file_control(database.get(), "main", SQLITE_FCNTL_FILE_POINTER, &file_);
  if (code != SQLITE_OK) return code;
  pageBytes_ = static_cast<std::uint32_t>(database.queryInteger("PRAGMA page_size").value_or(0));
  pages_ = static_cast<std::uint32_t>(database.queryInteger("PRAGMA page_count").value_or(0));
  mapNumber_ = 0;
  code = cleanFreePages();
  const std::uint32_t end = std::min(pages_, next_ + kPagesPerStep - 1);
  for (; code == SQLITE_OK && next_ <= end; ++next_) code = cleanPage(next_);
  if (code == SQLITE_OK) code = file_->pMethods->xSync(file_, SQLITE_SYNC_NORMAL);
  if (code != SQLITE_OK || next_ <= pages_) return code;
  next_ = 1;
  more = ++pass_ < kPasses;
  return SQLITE_OK;
}

// The list of free pages is a chain of pages that name the others.
SqliteCode PageCleaner::cleanFreePages() {
  Page trunk;
  SqliteCode code = read(1, trunk);
  std::uint32_t number = code == SQLITE_OK ? number32(trunk, kFirstTrunkAt) : 0;
  for (std::uint32_t count = 0; code == SQLITE_OK && number != 0; ++count) {
    if (number > pages_ || count > pages_) return kUnexpectedForm;
    code = read(number, trunk);
    if (code != SQLITE_OK) return code;
    const std::size_t leaves = number32(trunk, 4);
    if (8 + 4 * leaves > pageBytes_) return kUnexpectedForm;
    Page leaf;
    for (std::size_t index = 0; code == SQLITE_OK && index < leaves; ++index) {
      const std::uint32_t at = number32(trunk, 8 + 4 * index);
      if (at < 2 || at > pages_) return kUnexpectedForm;
      code = read(at, leaf);
      if (code == SQLITE_OK) code = zero(at, leaf, 0, pageBytes_);
    }
    if (code == SQLITE_OK) code = zero(number, trunk, 8 + 4 * leaves, pageBytes_);
    number = number32(trunk, 0);
  }
  return code;
}

SqliteCode PageCleaner::cleanPage(std::uint32_t number) {
  bool hasCells = false;
  SqliteCode code = isTree(number, hasCells);
  if (code != SQLITE_OK || !hasCells) return code;
  Page page;
  code = read(number, page);
  return code == SQLITE_OK ? cleanTree(number, page) : code;
}

// Sets `result` to whether the page is part of a table or an index. The ends of overflow pages are
// found through the cells that they belong to.
SqliteCode PageCleaner::isTree(std::uint32_t number, bool& result) {
  result = number == 1;
  if (number == 1 || number == kLockByte / pageBytes_ + 1) return SQLITE_OK;
  const std::uint32_t perMap = pageBytes_ / kMapEntry + 1;
  std::uint32_t map = (number - 2) / perMap * perMap + 2;
  if (map == kLockByte / pageBytes_ + 1) ++map;
  if (number <= map) return SQLITE_OK;  // the page map itself
  if (mapNumber_ != map) {
    const SqliteCode code = read(map, map_);
    if (code != SQLITE_OK) return code;
    mapNumber_ = map;
  }
  const std::size_t entry = std::size_t{kMapEntry} * (number - map - 1);
  if (entry >= pageBytes_) return kUnexpectedForm;
  result = map_[entry] == kRoot || map_[entry] == kTree;
  return SQLITE_OK;
}

SqliteCode PageCleaner::cleanTree(std::uint32_t number, Page& page) {
  const Bytes bytes(page.data(), pageBytes_);
  const std::size_t header = number == 1 ? kFileHeader : 0;
  const unsigned char type = page[header];
  const bool isLeaf = type == kTableLeaf || type == kIndexLeaf;
  if (!isLeaf && type != kTableInner && type != kIndexInner) return kUnexpectedForm;
  const std::size_t cells = number16(bytes, header + 3);
  const std::size_t pointers = header + (isLeaf ? 8 : 12);
  const std::size_t content = pointers + 2 * cells;
  if (content > pageBytes_) return kUnexpectedForm;
  std::vector<std::pair<std::size_t, std::size_t>> used;  // begin and end
  std::vector<Cell> overflowing;
  for (std::size_t index = 0; index < cells; ++index) {
    const std::size_t at = number16(bytes, pointers + 2 * index);
    const auto cell = at < content ? std::nullopt : cellAt(bytes, type, at);
    if (!cell || cell->end > pageBytes_) return kUnexpectedForm;
    used.emplace_back(at, cell->end);
    if (cell->overflow != 0) overflowing.push_back(*cell);
  }
  // A list of free pieces, of which each begins with the place of the next one and its length.
  std::size_t last = 0;
  for (std::size_t at = number16(bytes, header + 1); at != 0; at = number16(bytes, at)) {
    if (at <= last || at < content || at + 4 > pageBytes_) return kUnexpectedForm;
    used.emplace_back(at, at + 4);
    last = at;
  }
  std::ranges::sort(used);
  // All of the page is known now. Nothing was changed before.
  SqliteCode code = SQLITE_OK;
  for (const Cell& cell : overflowing) {
    if (code == SQLITE_OK) code = cleanOverflow(cell.overflow, cell.overflowBytes);
  }
  std::size_t free = content;
  for (const auto& [begin, end] : used) {
    if (code == SQLITE_OK && begin > free) code = zero(number, page, free, begin);
    free = std::max(free, end);
  }
  return code == SQLITE_OK && free < pageBytes_ ? zero(number, page, free, pageBytes_) : code;
}

// Cleans the end of the last overflow page of a payload that has `bytes` in overflow pages.
SqliteCode PageCleaner::cleanOverflow(std::uint32_t first, std::uint64_t bytes) {
  const std::uint64_t perPage = pageBytes_ - 4;
  // The pages of a damaged chain may form a ring.
  if (bytes > pages_ * perPage) return kUnexpectedForm;
  std::uint32_t number = first;
  Page page;
  for (;; bytes -= perPage) {
    if (number < 2 || number > pages_) return kUnexpectedForm;
    const bool isLast = bytes <= perPage;
    if (isLast) break;
    std::array<unsigned char, 4> next{};
    const SqliteCode code =
        file_->pMethods->xRead(file_, next.data(), static_cast<int>(next.size()),
                               static_cast<std::int64_t>(number - 1) * pageBytes_);
    if (code != SQLITE_OK) return code;
    number = number32(next, 0);
  }
  const SqliteCode code = read(number, page);
  return code == SQLITE_OK ? zero(number, page, 4 + bytes, pageBytes_) : code;
}

SqliteCode PageCleaner::read(std::uint32_t number, Page& page) {
  page.resize(pageBytes_);
  return file_->pMethods->xRead(file_, page.data(), static_cast<int>(pageBytes_),
                                static_cast<std::int64_t>(number - 1) * pageBytes_);
}

SqliteCode PageCleaner::zero(std::uint32_t number, Page& page, std::size_t begin, std::size_t end) {
  const auto from = page.begin() + static_cast<std::ptrdiff_t>(begin);
  const auto to = page.begin() + static_cast<std::ptrdiff_t>(end);
  if (std::all_of(from, to, [](unsigned char byte) { return byte == 0; })) return SQLITE_OK;
  std::fill(from, to, static_cast<unsigned char>(0));
  return file_->pMethods->xWrite(
      file_, &*from, static_cast<int>(end - begin),
      static_cast<std::int64_t>(number - 1) * pageBytes_ + static_cast<std::int64_t>(begin));
}

}  // namespace halvox::platform::linux_
