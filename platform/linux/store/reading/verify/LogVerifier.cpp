#include "platform/linux/store/reading/verify/LogVerifier.h"

#include <array>
#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

// The formats are those of https://www.sqlite.org/walformat.html and
// https://www.sqlite.org/fileformat.html#the_write_ahead_log.
constexpr std::size_t kLogHeader = 32;
constexpr std::size_t kFrameHeader = 24;
constexpr std::size_t kIndexHeader = 48;
constexpr std::uint32_t kMagic = 0x377F0682;  // the lowest bit: checksums of big-endian words
constexpr std::uint32_t kSmallestPage = 512;
constexpr std::uint32_t kLargestPage = 65536;

using Bytes = std::span<const unsigned char>;

std::uint32_t bigEndian(Bytes bytes, std::size_t at) {
  return std::uint32_t{bytes[at]} << 24U | std::uint32_t{bytes[at + 1]} << 16U |
         std::uint32_t{bytes[at + 2]} << 8U | std::uint32_t{bytes[at + 3]};
}
std::uint32_t littleEndian(Bytes bytes, std::size_t at) {
  return std::uint32_t{bytes[at + 3]} << 24U | std::uint32_t{bytes[at + 2]} << 16U |
         std::uint32_t{bytes[at + 1]} << 8U | std::uint32_t{bytes[at]};
}
std::uint32_t native(Bytes bytes, std::size_t at) {
  std::uint32_t number = 0;
  std::memcpy(&number, bytes.data() + at, sizeof number);
  return number;
}

struct Checksum {
  std::uint32_t first = 0;
  std::uint32_t second = 0;
  friend bool operator==(const Checksum&, const Checksum&) = default;

  // `word` reads a word of the bytes, whose number is a multiple of eight.
  template <typename Word>
  void add(Bytes bytes, Word word) {
    for (std::size_t at = 0; at < bytes.size(); at += 8) {
      first += word(bytes, at) + second;
      second += word(bytes, at + 4) + first;
    }
  }
};

bool readAt(int file, std::uint64_t offset, std::span<unsigned char> bytes) {
  const ssize_t length = ::pread(file, bytes.data(), bytes.size(), static_cast<off_t>(offset));
  return length == static_cast<ssize_t>(bytes.size());
}

// What the index says about the log.
struct LogIndex {
  std::uint32_t frames = 0;  // committed ones
  std::uint32_t copied = 0;  // of these, how many are copied into the database
  std::array<unsigned char, 8> salts{};
  friend bool operator==(const LogIndex&, const LogIndex&) = default;
};

// Returns nothing if there is no index, or if it is being written or was not completed.
std::optional<LogIndex> readIndex(const std::filesystem::path& database) {
  const UniqueFd file(::open((database.native() + "-shm").c_str(), O_RDONLY | O_CLOEXEC));
  std::array<unsigned char, 2 * kIndexHeader + 4> bytes{};
  if (!file || !readAt(file.get(), 0, bytes)) return std::nullopt;
  // The header is there twice. The copies differ while it is being written.
  if (std::memcmp(bytes.data(), bytes.data() + kIndexHeader, kIndexHeader) != 0) {
    return std::nullopt;
  }
  Checksum sum;
  const Bytes header(bytes.data(), kIndexHeader);
  sum.add(header.first(kIndexHeader - 8), native);
  const bool isInitialised = bytes[12] != 0;
  if (!isInitialised || sum != Checksum{native(header, 40), native(header, 44)}) {
    return std::nullopt;
  }
  LogIndex index{.frames = native(header, 16), .copied = native(Bytes(bytes), 2 * kIndexHeader)};
  std::memcpy(index.salts.data(), bytes.data() + 32, index.salts.size());
  return index;
}

// Reads the frames of a log, one after the other.
class LogFrames {
 public:
  explicit LogFrames(const std::filesystem::path& path)
      : file_(::open(path.c_str(), O_RDONLY | O_CLOEXEC)) {}

  // Returns false if there is no log, or only the beginning of its header.
  bool open() {
    if (!file_ || !readAt(file_.get(), 0, header_)) return false;
    pageBytes_ = bigEndian(header_, 8);
    return true;
  }
  [[nodiscard]] bool isHeaderRight() {
    const std::uint32_t magic = bigEndian(header_, 0);
    const bool isPage = pageBytes_ >= kSmallestPage && pageBytes_ <= kLargestPage &&
                        std::has_single_bit(pageBytes_);
    if ((magic & ~1U) != kMagic || !isPage) return false;
    isBigEndian_ = (magic & 1U) != 0;
    addToSum(Bytes(header_).first(24));
    return sum_ == Checksum{bigEndian(header_, 24), bigEndian(header_, 28)};
  }
  [[nodiscard]] Bytes salts() const { return Bytes(header_).subspan(16, 8); }
  [[nodiscard]] std::uint64_t offsetOf(std::uint32_t frame) const {
    return kLogHeader + std::uint64_t{frame} * (kFrameHeader + pageBytes_);
  }

  enum class Frame : std::uint8_t { kRight, kWrong, kOther, kNone };
  // Reads the frame of that number, from 0. kOther: a frame of an earlier use of the file.
  Frame read(std::uint32_t frame) {
    bytes_.resize(kFrameHeader + pageBytes_);
    if (!readAt(file_.get(), offsetOf(frame), bytes_)) return Frame::kNone;
    const Bytes bytes(bytes_);
    if (std::memcmp(bytes_.data() + 8, salts().data(), 8) != 0) return Frame::kOther;
    addToSum(bytes.first(8));
    addToSum(bytes.subspan(kFrameHeader));
    return sum_ == Checksum{bigEndian(bytes, 16), bigEndian(bytes, 20)} ? Frame::kRight
                                                                        : Frame::kWrong;
  }
  // After a wrong frame: returns true if a later frame is of the same use of the file.
  [[nodiscard]] bool hasFrameAfter(std::uint32_t frame) {
    const Frame next = read(frame + 1);
    return next == Frame::kRight || next == Frame::kWrong;
  }

 private:
  void addToSum(Bytes bytes) {
    isBigEndian_ ? sum_.add(bytes, bigEndian) : sum_.add(bytes, littleEndian);
  }

  UniqueFd file_;
  std::array<unsigned char, kLogHeader> header_{};
  std::uint32_t pageBytes_ = 0;
  bool isBigEndian_ = false;
  Checksum sum_;
  std::vector<unsigned char> bytes_;
};

std::string frameText(std::uint32_t frame) { return "frame " + std::to_string(frame + 1); }

std::string offsetText(std::uint64_t offset) { return "offset " + std::to_string(offset); }

}  // namespace

void verifyLog(const std::filesystem::path& database, Differences& differences) {
  const std::string path = database.native() + "-wal";
  // Read the index first. The log may grow meanwhile, but not lose frames that the index has.
  const auto index = readIndex(database);
  LogFrames frames(path);
  const bool hasLog = frames.open();
  const bool isRight = hasLog && frames.isHeaderRight();
  const bool isOfIndex =
      index.has_value() && index->frames > 0 &&
      (!isRight || std::memcmp(index->salts.data(), frames.salts().data(), 8) == 0);
  std::uint32_t count = 0;
  auto last = LogFrames::Frame::kNone;
  if (isRight) {
    while ((last = frames.read(count)) == LogFrames::Frame::kRight) ++count;
  }
  const std::uint32_t committed = isOfIndex ? index->frames : 0;
  const bool isShort = count < committed;
  const bool isBroken = last == LogFrames::Frame::kWrong && frames.hasFrameAfter(count);
  if (!isShort && !isBroken) return;
  // The service may have begun the log anew since the index was read.
  if (isShort && readIndex(database) != index) return;
  if (!isRight) {
    // The whole log may be missing if the database has all of it.
    if (index->copied >= index->frames) return;
    differences.add(path, offsetText(0),
                    "the write-ahead log has no right header; its index says that it has " +
                        std::to_string(committed) + " frames, whose commits are lost");
    return;
  }
  const std::string found =
      last == LogFrames::Frame::kWrong ? " has a wrong checksum" : " is missing";
  differences.add(
      path, offsetText(frames.offsetOf(count)),
      frameText(count) + found + "; the commits from there on are lost" +
          (isShort ? " (" + std::to_string(committed) + " frames were committed)" : std::string()));
}

}  // namespace halvox::platform::linux_
