#include "client/FrameRing.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <new>
#include <utility>

#include <sys/mman.h>

namespace halvox::client {
namespace {

// Even an unlimited ring does not need more address space than this.
constexpr std::size_t kMostBytes = std::size_t{1} << 30U;
constexpr std::size_t kMostFrames = std::size_t{1} << 24U;
// Memory that is touched in advance: as much as a burst needs while the client's thread keeps up. A
// page fault would cost an audio thread more than the whole message.
constexpr std::size_t kTouchedBytes = std::size_t{256} * 1024;

constexpr std::uint64_t kChange = std::uint64_t{1} << 32U;

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

  Segment next() override {
    const CellNumber cell = ring_.popCell();
    if (cell == kNoCell) return {};
    if (chain_.first == kNoCell) {
      chain_.first = cell;
    } else {
      ring_.next(chain_.last).store(cell, std::memory_order_relaxed);
    }
    chain_.last = cell;
    return {ring_.cell(cell), ring_.cell(cell) + kCellBytes};
  }
  // Leaves the cells to the caller.
  CellNumber release() { return std::exchange(chain_.first, kNoCell); }

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
    : maxFrames_(std::clamp<std::size_t>(maxFrames, 1, kMostFrames)),
      mask_(std::bit_ceil(maxFrames_) - 1),
      cells_(
          static_cast<CellNumber>((std::min(maxBytes, kMostBytes) + kCellBytes - 1) / kCellBytes)),
      slots_(std::make_unique<Slot[]>(mask_ + 1)),
      memory_(map(std::size_t{cells_} * kCellBytes)),
      next_(std::make_unique<std::atomic<CellNumber>[]>(cells_)) {}

EncodeOutcome FrameRing::tryPush(const MessageView& message) { return push(message); }

EncodeOutcome FrameRing::tryPush(const EncodedMessageView& message) { return push(message); }

template <typename Content>
EncodeOutcome FrameRing::push(const BasicMessageView<Content>& message) {
  // reservePosition() tests this again. The test here saves encoding the message while the ring is
  // full.
  if (isFullAt(tail_.load(std::memory_order_relaxed))) return EncodeOutcome::kNoRoom;
  ChainSource cells(*this);
  SegmentWriter writer(cells);
  const EncodeOutcome outcome = encodeBody(writer, message);
  if (outcome != EncodeOutcome::kDone) return outcome;
  std::uint64_t position = 0;
  if (!reservePosition(position)) return EncodeOutcome::kNoRoom;
  Slot& free = slot(position);
  free.firstCell = cells.release();
  free.bytes = static_cast<std::uint32_t>(writer.position());
  free.ready.store(position + 1, std::memory_order_seq_cst);
  return EncodeOutcome::kDone;
}

bool FrameRing::isFullAt(std::uint64_t position) const {
  // An outdated position may be below `released_`.
  const std::uint64_t released = released_.load(std::memory_order_acquire);
  return position >= released && position - released >= maxFrames_;
}

bool FrameRing::reservePosition(std::uint64_t& position) {
  position = tail_.load(std::memory_order_relaxed);
  do {
    if (isFullAt(position)) return false;
  } while (!tail_.compare_exchange_weak(position, position + 1, std::memory_order_seq_cst,
                                        std::memory_order_relaxed));
  return true;
}

FrameRing::CellNumber FrameRing::popCell() {
  std::uint64_t top = free_.load(std::memory_order_acquire);
  while (static_cast<std::uint32_t>(top) != 0) {
    const CellNumber first = static_cast<std::uint32_t>(top) - 1;
    // If another thread takes this cell meanwhile, the number read here is wrong, and the exchange
    // fails.
    const CellNumber second = next(first).load(std::memory_order_relaxed);
    const std::uint64_t rest = (top & ~std::uint64_t{UINT32_MAX}) + kChange + (second + 1U);
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
    pushed = (top & ~std::uint64_t{UINT32_MAX}) + kChange + (chain.first + std::uint64_t{1});
  } while (!free_.compare_exchange_weak(top, pushed, std::memory_order_acq_rel,
                                        std::memory_order_relaxed));
}

bool FrameRing::isReady() const {
  return slot(head_).ready.load(std::memory_order_seq_cst) == head_ + 1;
}

void FrameRing::take(char* to) {
  const Slot& oldest = slot(head_);
  std::size_t rest = oldest.bytes;
  CellNumber number = oldest.firstCell;
  if (taken_.first == kNoCell) {
    taken_.first = number;
  } else {
    next(taken_.last).store(number, std::memory_order_relaxed);
  }
  for (;;) {
    const std::size_t part = std::min(rest, kCellBytes);
    if (to != nullptr) {
      std::memcpy(to, cell(number), part);
      to += part;
    }
    rest -= part;
    if (rest == 0) break;
    number = next(number).load(std::memory_order_relaxed);
  }
  taken_.last = number;
  ++head_;
}

void FrameRing::release() {
  if (taken_.first == kNoCell) return;
  pushCells(taken_);
  taken_ = {};
  released_.store(head_, std::memory_order_release);
}

}  // namespace halvox::client
