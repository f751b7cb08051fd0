#include "tools/StreamFinish.h"

#include <ctime>

#include "platform/linux/store/reading/StoreUse.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::StreamBuilder;
using platform::linux_::StoreUse;

// The clock by which services count the machine's uptime.
double machineUptime() {
  constexpr double kNanosecondsPerSecond = 1e9;
  timespec time{};
  ::clock_gettime(CLOCK_BOOTTIME, &time);
  return static_cast<double>(time.tv_sec) +
         static_cast<double>(time.tv_nsec) / kNanosecondsPerSecond;
}

}  // namespace

StreamBuilder::Finish streamFinish(const std::filesystem::path& directory) {
  const auto server = platform::linux_::storeServer(directory);
  // Of a copied database nobody knows.
  if (server.use != StoreUse::kServed) {
    return {.serviceIsGone = server.use == StoreUse::kNotServed};
  }
  // While a service runs, its streams run until now. The store has times of the wall clock.
  const double time = timeNow();
  StreamBuilder::Finish finish{.now = time};
  if (server.start) {
    finish.service = StreamBuilder::ServiceTimes{
        .stamp = time, .uptime = machineUptime() - *server.start, .start = *server.start};
  }
  return finish;
}

}  // namespace halvox::tools
