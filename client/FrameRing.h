#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>

#include "client/RequestEncoder.h"

namespace halvox::client {

// Passes messages from any number of threads to one, bounded in number and in bytes. A frame in the
// ring is a body that is ready for the wire; its header, the same bytes for every message, is added
// when the frame is sent.
//
//                   pop                  publish                 isReady, take
//   free cells ─────────────► a frame ──────────────► newest first ─────────────► the consumer
//       ▲                                                                             │
//       └───────────────────────────── release(), many at once ───────────────────────┘
//
// The memory of frames is cells of 512 bytes. A frame takes as many as it needs, and needs no other
// memory. Freed cells are used again first: a client whose thread keeps up touches only a few of
// them. Each complete frame refers to the one that was complete before it. The consumer takes the
// whole list at once and reverses it.
//
// A producer takes no lock, allocates nothing and makes no system call. It repeats a step only if
// another thread has completed the same step meanwhile. A thread that is interrupted therefore
// cannot hold up any other.
//
// Rejected: a list of dictionaries, encoded by the consumer. The program's next change of a
// dictionary would then have to copy it, on the audio thread. Also rejected: one ring of bytes. All
// of it would be in memory after the first lap, which is too much for each audio process. Slots in
// the order of the frames were tried. They took one more atomic exchange for each message.
class FrameRing {
 public:
  // Throws std::bad_alloc.
  FrameRing(std::size_t maxFrames, std::size_t maxBytes);
  FrameRing(const FrameRing&) = delete;
  FrameRing& operator=(const FrameRing&) = delete;

  // Any thread may call it. Returns kNoRoom if a bound is reached. Changes nothing unless it
  // returns kDone.
  EncodeOutcome tryPush(const MessageView& message);
  EncodeOutcome tryPush(const EncodedMessageView& message);
  // The number of frames accepted so far, which is the position of the next one.
  [[nodiscard]] std::uint64_t tail() const;

  // Only the consumer may call the following functions.
  // The position of the oldest frame in the ring.
  [[nodiscard]] std::uint64_t head() const { return head_; }
  // Returns true if there is a frame.
  [[nodiscard]] bool isReady() { return oldest_ != kNoCell || takeList(); }
  // The size of the oldest frame. Call this and take() only after isReady() has returned true.
  [[nodiscard]] std::size_t frontBytes() const { return headOf(oldest_).bytes; }
  // Copies the oldest frame to `to`, or nowhere if that is null, and removes it.
  void take(char* to);
  // Gives the room of removed frames back to the producers.
  void release();

 private:
  using CellNumber = std::uint32_t;
  static constexpr CellNumber kNoCell = std::numeric_limits<CellNumber>::max();
  static constexpr std::size_t kCellBytes = 512;

  // At the start of a frame's first cell.
  struct FrameHead {
    std::uint32_t bytes = 0;  // of the frame, without this
    // The first cell of the frame before this one; in the consumer's list, of the one after it.
    CellNumber neighbour = kNoCell;
  };
  // Cells in the order of their `next` numbers.
  struct Chain {
    CellNumber first = kNoCell;
    CellNumber last = kNoCell;
  };
  class ChainSource;
  struct Unmap {
    std::size_t bytes = 0;
    void operator()(char* memory) const;
  };

  template <typename Content>
  EncodeOutcome push(const BasicMessageView<Content>& message);
  static std::unique_ptr<char, Unmap> map(std::size_t bytes);
  [[nodiscard]] char* cell(CellNumber number) const {
    return memory_.get() + std::size_t{number} * kCellBytes;
  }
  [[nodiscard]] FrameHead headOf(CellNumber number) const;
  void setHead(CellNumber number, const FrameHead& head) const;
  [[nodiscard]] std::atomic<CellNumber>& next(CellNumber number) const { return next_[number]; }
  CellNumber popCell();
  void pushCells(const Chain& chain);
  [[nodiscard]] bool isFull(std::uint64_t newest) const;
  [[nodiscard]] bool publish(CellNumber first, std::size_t bytes);
  bool takeList();
  void touchAhead();

  const std::uint32_t maxFrames_;
  const CellNumber cells_;
  const std::unique_ptr<char, Unmap> memory_;
  const std::unique_ptr<std::atomic<CellNumber>[]> next_;  // the cell after each cell
  // The following are on a cache line each: producers write the first three, the consumer the
  // others. The low half of `free_` is the first free cell + 1, or 0. The high half counts changes,
  // because a cell may be popped and pushed between another thread's load and exchange. Acquire and
  // release order the consumer's reading of a cell before its reuse.
  alignas(64) std::atomic<std::uint64_t> free_{0};
  // All cells from this one on have never been used.
  alignas(64) std::atomic<CellNumber> fresh_{0};
  // The low half is the first cell + 1 of the newest frame, or 0 if the consumer has taken all. The
  // high half counts the frames. Orders the writing of a frame before its reading. Sequentially
  // consistent with the consumer's announcement that it goes to sleep: the producer sees the
  // announcement, or the consumer sees the frame.
  alignas(64) std::atomic<std::uint64_t> newest_{0};
  // All positions below this one have been released.
  alignas(64) std::atomic<std::uint64_t> released_{0};
  alignas(64) std::uint64_t head_ = 0;
  CellNumber oldest_ = kNoCell;  // the consumer's list, in the order of the frames
  Chain taken_;
  std::size_t touched_ = 0;  // bytes from the start of the memory; 0: only what map() touches
};

}  // namespace halvox::client
