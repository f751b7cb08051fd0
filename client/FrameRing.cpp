#include "client/FrameRing.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

#include <sys/mman.h>

namespace halvox::client {
namespace {

// The largest bounds of a ring. No ring needs more address space than kMostBytes.
constexpr std::size_t kMostBytes = std::size_t{1} << 30U;
constexpr std::size_t kMostFrames = std::size_t{1} << 24U;
// How much memory is touched in advance: as much as a burst needs while the client's thread keeps
// up. A page fault would cost an audio thread more than the whole message. The size is a multiple
// of every page size.
constexpr std::size_t kTouchedBytes = std::size_t{256} * 1024;

// free_ and newest_ are words of two halves. The high half is a counter. The low half is the number
// of a cell plus 1, or 0 for no cell.
constexpr std::uint64_t kOneMore = std::uint64_t{1} << 32U;
constexpr std::uint64_t kCountMask = ~std::uint64_t{UINT32_MAX};
std::uint32_t countOf(std::uint64_t word) { return static_cast<std::uint32_t>(word >> 32U); }

}  // namespace

// Collects the cells of one frame. Returns them to the ring if the frame is not completed.
class FrameRing::ChainSource final : public SegmentSource {
 public:
  explicit ChainSource(FrameRing& ring) : ring_(ring) {}
  ChainSource(const ChainSource&) = delete;
  ChainSource& operator=(const ChainSource&) = delete;
  ~ChainSource() override {
    if (chain_.first != kNoCell) ring_.pushCells(chain_);
  }

  [[gnu::hot]] Segment next() override {
    const CellNumber cell = ring_.popCell();
    if (cell == kNoCell) return {};
    char* const begin = ring_.cell(cell);
    char* const end = begin + kCellBytes;
    const bool isFirst = chain_.first == kNoCell;
    if (isFirst) {
      chain_.first = cell;
    } else {
      ring_.next(chain_.last).store(cell, std::memory_order_relaxed);
    }
    chain_.last = cell;
    return {isFirst ? begin + sizeof(FrameHead) : begin, end};
  }
  [[nodiscard]] CellNumber first() const { return chain_.first; }
  // The frame is in the ring now. Does not return its cells.
  void release() { chain_ = {}; }

 private:
  FrameRing& ring_;
  Chain chain_;
};

void FrameRing::Unmap::operator()(char* memory) const { munmap(memory, bytes); }

std::unique_ptr<char, FrameRing::Unmap> FrameRing::map(std::size_t bytes) {
  bytes = std::max<std::size_t>(bytes, 1);
  void* memory = mmap(nullptr, bytes, PROT_READ | PROT_WRITE,
                      MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  if (memory == MAP_FAILED) throw std::bad_alloc();
  std::memset(memory, 0, std::min(bytes, kTouchedBytes));
  return {static_cast<char*>(memory), Unmap{bytes}};
}

FrameRing::FrameRing(std::size_t maxFrames, std::size_t maxBytes)
    : maxFrames_(static_cast<std::uint32_t>(std::clamp<std::size_t>(maxFrames, 1, kMostFrames))),
      cells_(
          static_cast<CellNumber>((std::min(maxBytes, kMostBytes) + kCellBytes - 1) / kCellBytes)),
      memory_(map(std::size_t{cells_} * kCellBytes)),
      next_(std::make_unique<std::atomic<CellNumber>[]>(cells_)) {}

EncodeOutcome FrameRing::tryPush(const MessageView& message) { return push(message); }

[[gnu::hot]] EncodeOutcome FrameRing::tryPush(const EncodedMessageView& message) {
  return push(message);
}

template <typename Content>
[[gnu::hot]] EncodeOutcome FrameRing::push(const BasicMessageView<Content>& message) {
  // publish() tests this again. The test here saves encoding a message while the ring is full.
  if (isFull(newest_.load(std::memory_order_relaxed))) return EncodeOutcome::kNoRoom;
  ChainSource cells(*this);
  SegmentWriter writer(cells);
  const EncodeOutcome outcome = encodeBody(writer, message);
  if (outcome != EncodeOutcome::kDone) return outcome;
  if (!publish(cells.first(), writer.position())) return EncodeOutcome::kNoRoom;
  cells.release();
  return EncodeOutcome::kDone;
}

FrameRing::FrameHead FrameRing::headOf(CellNumber number) const {
  FrameHead head;
  std::memcpy(&head, cell(number), sizeof head);
  return head;
}

void FrameRing::setHead(CellNumber number, const FrameHead& head) const {
  std::memcpy(cell(number), &head, sizeof head);
}

bool FrameRing::isFull(std::uint64_t newest) const {
  // `newest` may be outdated, and its count may be less than the number of released frames. The
  // difference is then negative, and must be compared as a signed number.
  const auto released = static_cast<std::uint32_t>(released_.load(std::memory_order_relaxed));
  return static_cast<std::int32_t>(countOf(newest) - released) >=
         static_cast<std::int32_t>(maxFrames_);
}

[[gnu::hot]] bool FrameRing::publish(CellNumber first, std::size_t bytes) {
  std::uint64_t newest = newest_.load(std::memory_order_relaxed);
  std::uint64_t published = 0;
  do {
    if (isFull(newest)) return false;
    const CellNumber before = static_cast<std::uint32_t>(newest) - 1U;  // kNoCell if there is none
    setHead(first, {.bytes = static_cast<std::uint32_t>(bytes), .neighbour = before});
    published = (newest & kCountMask) + kOneMore + (first + std::uint64_t{1});
  } while (!newest_.compare_exchange_weak(newest, published, std::memory_order_seq_cst,
                                          std::memory_order_relaxed));
  return true;
}

std::uint64_t FrameRing::tail() const {
  // The count has 32 bits. The ring never has as many frames as half of its range, and the
  // difference of the counts is therefore exact.
  const std::uint64_t released = released_.load(std::memory_order_acquire);
  const std::uint32_t count = countOf(newest_.load(std::memory_order_seq_cst));
  return released + static_cast<std::uint32_t>(count - static_cast<std::uint32_t>(released));
}

[[gnu::hot]] FrameRing::CellNumber FrameRing::popCell() {
  std::uint64_t top = free_.load(std::memory_order_acquire);
  while (static_cast<std::uint32_t>(top) != 0) {
    const CellNumber first = static_cast<std::uint32_t>(top) - 1;
    // If another thread takes this cell before the exchange, the number read here may be wrong. The
    // exchange then fails.
    const CellNumber second = next(first).load(std::memory_order_relaxed);
    const std::uint64_t rest = (top & kCountMask) + kOneMore + (second + 1U);
    if (free_.compare_exchange_weak(top, rest, std::memory_order_acquire)) return first;
  }
  if (fresh_.load(std::memory_order_relaxed) >= cells_) return kNoCell;
  const CellNumber fresh = fresh_.fetch_add(1, std::memory_order_relaxed);
  if (fresh < cells_) return fresh;
  fresh_.fetch_sub(1, std::memory_order_relaxed);
  return kNoCell;
}

void FrameRing::pushCells(const Chain& chain) {
  std::uint64_t top = free_.load(std::memory_order_relaxed);
  std::uint64_t pushed = 0;
  do {
    // If no cell is free, this stores kNoCell, because kNoCell + 1 is 0.
    next(chain.last).store(static_cast<std::uint32_t>(top) - 1U, std::memory_order_relaxed);
    pushed = (top & kCountMask) + kOneMore + (chain.first + std::uint64_t{1});
  } while (!free_.compare_exchange_weak(top, pushed, std::memory_order_acq_rel,
                                        std::memory_order_relaxed));
}

// Takes all frames that the producers have published since the last call, and brings them into the
// order of publishing. Returns false if there is none.
bool FrameRing::takeList() {
  // Load first. While there is no frame, a load leaves the cache line of the word with the
  // producers, whereas fetch_and() would take it from them.
  if (static_cast<std::uint32_t>(newest_.load(std::memory_order_seq_cst)) == 0) return false;
  const std::uint64_t newest = newest_.fetch_and(kCountMask, std::memory_order_acq_rel);
  CellNumber number = static_cast<std::uint32_t>(newest) - 1U;
  while (number != kNoCell) {
    FrameHead head = headOf(number);
    const CellNumber before = std::exchange(head.neighbour, oldest_);
    setHead(number, head);
    oldest_ = std::exchange(number, before);
  }
  return true;
}

FrameRing::FrameNumber FrameRing::take() {
  ++head_;
  return std::exchange(oldest_, headOf(oldest_).neighbour);
}

template <typename OnPart>
FrameRing::CellNumber FrameRing::forEachPart(FrameNumber frame, OnPart onPart) const {
  std::size_t rest = headOf(frame).bytes;
  std::size_t used = sizeof(FrameHead);
  CellNumber number = frame;
  for (;;) {
    const std::size_t part = std::min(rest, kCellBytes - used);
    onPart(cell(number) + used, part);
    rest -= part;
    if (rest == 0) return number;
    number = next(number).load(std::memory_order_relaxed);
    used = 0;
  }
}

void FrameRing::copy(FrameNumber frame, char* to) const {
  forEachPart(frame, [&to](const char* from, std::size_t size) {
    std::memcpy(to, from, size);
    to += size;
  });
}

void FrameRing::drop(FrameNumber frame) {
  const CellNumber last = forEachPart(frame, [](const char*, std::size_t) {});
  if (dropped_.first == kNoCell) {
    dropped_.first = frame;
  } else {
    next(dropped_.last).store(frame, std::memory_order_relaxed);
  }
  dropped_.last = last;
  ++droppedCount_;
}

void FrameRing::release() {
  if (dropped_.first == kNoCell) return;
  pushCells(dropped_);
  dropped_ = {};
  released_.store(droppedCount_, std::memory_order_release);
  touchAhead();
}

// Lets the kernel map the memory that the producers need next. Kernels before 5.14 refuse this, and
// the producers then cause the page faults.
void FrameRing::touchAhead() {
  const std::size_t all = std::size_t{cells_} * kCellBytes;
  const std::size_t used = std::size_t{fresh_.load(std::memory_order_relaxed)} * kCellBytes;
  if (touched_ >= all || used + kTouchedBytes / 2 <= touched_) return;
  const std::size_t end = std::min((used / kTouchedBytes + 2) * kTouchedBytes, all);
  madvise(memory_.get() + touched_, end - touched_, MADV_POPULATE_WRITE);
  touched_ = end;
}

}  // namespace halvox::client
