#pragma once

#include <chrono>
#include <cstdint>
#include <ostream>

namespace halvox::tools {

// Shows at a terminal how far an export has come, on one line that is written over and removed at
// the end. Elsewhere it writes nothing. Belongs to one thread.
class ExportProgress {
 public:
  enum class Shown : std::uint8_t { kNever, kAtTerminal };

  // `out` must outlive it.
  ExportProgress(std::ostream& out, Shown shown) : out_(out), shown_(shown) {}
  ExportProgress(const ExportProgress&) = delete;
  ExportProgress& operator=(const ExportProgress&) = delete;
  ~ExportProgress() { clear(); }

  // Call for each record that was read. `time` is the record's, in seconds since 1970.
  void onRecord(double time) {
    // Reading the clock costs as much as a record.
    constexpr std::uint64_t kStep = 4096;
    if (++records_ % kStep == 0 && shown_ == Shown::kAtTerminal) show(time);
  }
  // Removes the line.
  void clear();

 private:
  void show(double time);

  std::ostream& out_;
  const Shown shown_;
  std::uint64_t records_ = 0;
  std::chrono::steady_clock::time_point last_;
  bool isVisible_ = false;
};

}  // namespace halvox::tools
