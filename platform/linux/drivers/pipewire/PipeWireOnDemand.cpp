#include "platform/linux/drivers/pipewire/PipeWireOnDemand.h"

#include <cstdint>
#include <filesystem>
#include <string>
#include <system_error>

#include "platform/linux/drivers/pipewire/NodeChannel.h"
#include "platform/linux/drivers/pipewire/PipeWireEntryPoint.h"
#include "platform/linux/drivers/pipewire/ServerSocket.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::array<std::uint64_t, 1> kNone{0};
// How long a running server may take to name its objects. A longer time would make the source late.
constexpr std::chrono::milliseconds kLongestOpening{800};

bool isModuleThere() {
  std::error_code ignored;
  return std::filesystem::exists(modulePath(kPipeWireModule), ignored);
}

}  // namespace

// Held by readings that were made before the module was loaded. When the module is loaded, a
// session that holds such a reading must also hold one of the loaded source, which follows the
// server only while a reading is held.
struct PipeWireOnDemand::Lease {
  std::shared_ptr<const Reading> ofLoaded;
};

PipeWireOnDemand::PipeWireOnDemand(LogCategory& log)
    : category_(log),
      log_(log, "PipeWireOnDemand"),
      connections_{makeChannel(describeNodeChannel(kSinkGroup, "pipewire", "connections")),
                   makeChannel(describeNodeChannel(kSourceGroup, "pipewire", "connections"))} {}

void PipeWireOnDemand::open() {
  // Load the module now if a socket exists. Also try to load it if its file is missing, so that the
  // error is logged at the start and not during a session. Otherwise the first session loads the
  // module, because waiting for a server would mean watching for its socket all the time.
  if (hasServerSocket() || !isModuleThere()) load(kLongestOpening);
}

std::shared_ptr<const Reading> PipeWireOnDemand::read() {
  if (source_ != nullptr) return source_->read();
  std::shared_ptr<Lease> lease = lease_.lock();
  if (lease == nullptr) lease = std::make_shared<Lease>();
  lease_ = lease;
  for (const ChannelList::Channel& channel : connections_) maker_.add(channel, kNone);
  return maker_.finish(std::move(lease));
}

void PipeWireOnDemand::sampled() {
  if (source_ != nullptr || isDisabled_) return;
  // Do not wait for the server, because the samples of other sessions would wait, too.
  load(std::chrono::milliseconds::zero());
  if (source_ == nullptr) return;
  // If no session holds a reading, the source need not follow the server.
  if (const std::shared_ptr<Lease> lease = lease_.lock()) lease->ofLoaded = source_->read();
}

void PipeWireOnDemand::load(std::chrono::milliseconds longestOpening) {
  const auto loaded = loadEntryPoint<decltype(halvox_drivers_pipewire_2)>(kPipeWireModule);
  if (!loaded) {
    isDisabled_ = true;
    log_.error("drivers.pipewire = true needs ", loaded.error().message,
               "; PipeWire's counters are disabled until the next start");
    return;
  }
  source_.reset((*loaded)(longestOpening, category_));
  source_->open();
}

}  // namespace halvox::platform::linux_
