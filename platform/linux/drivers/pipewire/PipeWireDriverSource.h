#pragma once

#include <chrono>
#include <memory>

#include "platform/linux/drivers/DriverSource.h"

namespace halvox::platform::linux_ {

// What a PipeWire server counts of its sinks (group "Speaker") and sources (group "Rx"): cycles,
// xruns, the times of each cycle, and the states of the nodes.
//
// The server is followed on a thread of the library's own, which sleeps until the server tells
// something: while nobody holds a reading, only that nodes come, go or change their state. Its
// profiler, which tells of each cycle, is bound while somebody holds a reading, so a node's cycles
// are those of such times; the first reading begins one.
//
// When there is no server, it is looked for when somebody begins to hold a reading, and met as soon
// as its socket appears while somebody does; the same when the server goes. Nothing wakes up in the
// meantime. Until it is there, the only channels are "connections", which count how often it was
// reached.
class PipeWireDriverSource final : public DriverSource {
 public:
  struct Options {
    // How long open() waits for what the server has.
    std::chrono::milliseconds longestOpening{800};
  };

  PipeWireDriverSource() : PipeWireDriverSource(Options()) {}
  explicit PipeWireDriverSource(Options options);
  ~PipeWireDriverSource() override;

  [[nodiscard]] std::string_view name() const override { return "pipewire"; }
  void open() override;
  // Never waits for the server.
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

  // Whether the profiler is bound at the moment. Any thread.
  [[nodiscard]] bool isProfiling() const;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::platform::linux_
