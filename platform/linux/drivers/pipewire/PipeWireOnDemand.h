#pragma once

#include <array>
#include <chrono>
#include <memory>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// A PipeWire source that loads its module when it is needed: at the start of the service if the
// socket of a server exists, and otherwise at the first sample of a session. Until then the service
// does not map PipeWire's library.
//
//   waiting --socket at the start, or first sample--> loaded
//      |
//      +--the module cannot be loaded--> disabled (until the next start)
//
// While it is waiting or disabled, its only channels are the `connections` of a source that has not
// reached a server. Belongs to the thread of its reader.
class PipeWireOnDemand final : public DriverSource {
 public:
  // `log` must outlive the source.
  explicit PipeWireOnDemand(LogCategory& log);

  [[nodiscard]] std::string_view name() const override { return "pipewire"; }
  void open() override;
  [[nodiscard]] std::shared_ptr<const Reading> read() override;
  void sampled() override;

 private:
  struct Lease;

  void load(std::chrono::milliseconds longestOpening);

  LogCategory& category_;  // also used by the loaded source
  const ObjectLog log_;
  std::array<ChannelList::Channel, 2> connections_;
  bool isDisabled_ = false;
  std::unique_ptr<DriverSource> source_;  // null until the module is loaded
  std::weak_ptr<Lease> lease_;            // of the readings before it was loaded
  ReadingMaker maker_;
};

}  // namespace halvox::platform::linux_
