#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>

#include "client/RequestEncoder.h"

namespace halvox::client {

// Passes messages from any number of threads (the producers) to one thread (the consumer). Their
// number and their bytes are bounded. A frame in the ring is a body that is ready for the wire. Its
// header, which has the same bytes for every message, is added when the frame is sent.
//
//                   pop                  publish                 isReady, take
//   free cells ─────────────► a frame ──────────────► newest first ─────────────► the consumer
//       ▲                                                                             │ drop()
//       └───────────────────────────── release(), many at once ───────────────────────┘
//
// The memory of the ring is divided into cells of 512 bytes. A frame takes as many cells as it
// needs, and no other memory. Freed cells are used again first. A client whose thread keeps up
// therefore touches only a few cells. Each published frame refers to the frame that was published
// before it. The consumer takes the whole list at once and reverses it.
//
// A producer takes no lock, allocates nothing and makes no system call. It repeats a step only if
// another thread has completed the same step at that moment. An interrupted thread therefore cannot
// hold up another one.
//
// Rejected: a list of dictionaries that the consumer encodes. The audio thread would then have to
// copy a dictionary at its next change. Also rejected: one ring of bytes. All of it would be in
// memory after the first round, which is too much for each audio process. Slots in the order of the
// frames were tried. They took one more atomic exchange for each message.
class FrameRing {
 public:
  // Names a frame that the consumer has taken and not dropped.
  using FrameNumber = std::uint32_t;

  // Throws std::bad_alloc.
  FrameRing(std::size_t maxFrames, std::size_t maxBytes);
  FrameRing(const FrameRing&) = delete;
  FrameRing& operator=(const FrameRing&) = delete;

  // Any thread may call these functions. They return kNoRoom if a bound is reached, and change
  // nothing unless they return kDone.
  EncodeOutcome tryPush(const MessageView& message);
  EncodeOutcome tryPush(const EncodedMessageView& message);
  // Returns the number of frames accepted so far, which is the position of the next frame.
  [[nodiscard]] std::uint64_t tail() const;

  // Only the consumer may call the following functions.
  // Returns the position of the oldest frame that was not taken.
  [[nodiscard]] std::uint64_t head() const { return head_; }
  // Returns true if there is a frame.
  [[nodiscard]] bool isReady() { return oldest_ != kNoCell || takeList(); }
  // Takes the oldest frame. Call this function only after isReady() has returned true. The frame
  // keeps its cells until drop(), because the consumer may have to send it again.
  [[nodiscard]] FrameNumber take();
  [[nodiscard]] std::size_t bytesOf(FrameNumber frame) const { return headOf(frame).bytes; }
  // Copies the bytes of a frame to `to`.
  void copy(FrameNumber frame, char* to) const;
  // Drops a frame, in any order. It counts against the bounds until release().
  void drop(FrameNumber frame);
  // Returns the cells of dropped frames to the free cells.
  void release();

 private:
  using CellNumber = std::uint32_t;
  static constexpr CellNumber kNoCell = std::numeric_limits<CellNumber>::max();
  static constexpr std::size_t kCellBytes = 512;

  // Stands at the start of a frame's first cell.
  struct FrameHead {
    std::uint32_t bytes = 0;  // of the frame, without this head
    // The first cell of the frame that was published before this one. In the consumer's list: of
    // the frame that was published after it.
    CellNumber neighbour = kNoCell;
  };
  // A list of cells, linked by next_.
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
  // Calls `onPart` with each part of a frame's bytes. Returns the frame's last cell.
  template <typename OnPart>
  CellNumber forEachPart(FrameNumber frame, OnPart onPart) const;
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
  // The following members have a cache line each, because producers write the first three and the
  // consumer writes the others. The low half of `free_` is the first free cell + 1, or 0. The high
  // half counts changes: between the load and the exchange of one thread, another may pop a cell
  // and push it again, and the exchange must fail then. Acquire and release order the consumer's
  // reading of a cell before its reuse.
  alignas(64) std::atomic<std::uint64_t> free_{0};
  // This cell and all cells after it have never been used.
  alignas(64) std::atomic<CellNumber> fresh_{0};
  // The low half is the first cell + 1 of the newest frame, or 0 if the consumer has taken all
  // frames. The high half counts the frames. Orders the writing of a frame before its reading.
  // Sequentially consistent with the consumer's announcement that it goes to sleep: either the
  // producer sees the announcement, or the consumer sees the frame.
  alignas(64) std::atomic<std::uint64_t> newest_{0};
  // How many frames have been released.
  alignas(64) std::atomic<std::uint64_t> released_{0};
  alignas(64) std::uint64_t head_ = 0;
  CellNumber oldest_ = kNoCell;  // the consumer's list, in the order of the frames
  Chain dropped_;
  std::uint64_t droppedCount_ = 0;
  std::size_t touched_ = 0;  // bytes from the start of the memory; 0: only what map() touches
};

}  // namespace halvox::client
