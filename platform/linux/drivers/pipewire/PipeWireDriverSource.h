#pragma once

#include <chrono>
#include <memory>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

// Reports what a PipeWire server does with its sinks (group "Speaker") and sources (group "Rx"):
// cycles, xruns, the times of each cycle, and the states of the nodes.
//
// Threads: the library has a thread that follows the server. It sleeps until the server sends an
// event. While no reading is held, events come only when nodes appear, disappear or change their
// state. The profiler, which reports each cycle, is bound only while a reading is held, because an
// idle service must not wake up for every cycle. Cycles are therefore counted only from the first
// held reading on, while any is held. Owner: its SourceReader, which calls it on one thread.
// Failure: without a server there are only the channels "connections", which count how often the
// server was reached. The source looks for the server when the first reading is held, and connects
// as soon as its socket appears while a reading is held. No thread wakes up until then.
class PipeWireDriverSource final : public DriverSource {
 public:
  struct Options {
    // How long open() waits for the server's objects. Below SourceReader::kLongestOpening.
    std::chrono::milliseconds longestOpening{800};
  };

  // `log` must outlive the source.
  explicit PipeWireDriverSource(LogCategory& log) : PipeWireDriverSource(log, Options()) {}
  PipeWireDriverSource(LogCategory& log, Options options);
  ~PipeWireDriverSource() override;

  [[nodiscard]] std::string_view name() const override { return "pipewire"; }
  void open() override;
  // Never waits for the server.
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

  // Returns whether the profiler is bound at the moment. Any thread may call it. For tests.
  [[nodiscard]] bool isProfiling() const;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::platform::linux_
