#include "tools/status/StatusSource.h"

#include <algorithm>
#include <charconv>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <system_error>
#include <utility>

#include <sys/types.h>
#include <unistd.h>

#include "client/HalvoxClient.h"
#include "platform/linux/runtime/Version.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/StoreUse.h"
#include "tools/ServiceConfiguration.h"
#include "tools/TimeText.h"
#include "tools/top/TopModel.h"

namespace halvox::tools {
namespace {

using platform::linux_::BusKind;
using platform::linux_::Configuration;
using platform::linux_::LinkBackend;
using platform::linux_::OptionalPart;

constexpr std::uint64_t kMebibyte = 1024 * 1024;

std::string contents(const std::filesystem::path& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), {}};
}

double bootSeconds() {
  constexpr double kNanosecondsPerSecond = 1e9;
  timespec time{};
  ::clock_gettime(CLOCK_BOOTTIME, &time);
  return static_cast<double>(time.tv_sec) +
         static_cast<double>(time.tv_nsec) / kNanosecondsPerSecond;
}

// The bytes of all files below a directory; nothing if there is none or it may not be read.
std::optional<std::uint64_t> bytesBelow(const std::filesystem::path& directory) {
  std::error_code error;
  std::filesystem::recursive_directory_iterator entry(directory, error);
  if (error) return std::nullopt;
  std::uint64_t bytes = 0;
  while (entry != std::filesystem::recursive_directory_iterator()) {
    std::error_code gone;  // the service deletes files meanwhile
    if (entry->is_regular_file(gone) && !entry->is_symlink(gone)) {
      const std::uintmax_t size = entry->file_size(gone);
      if (!gone) bytes += size;
    }
    entry.increment(error);
    if (error) return std::nullopt;
  }
  return bytes;
}

std::optional<std::uint64_t> storeBytes(const std::filesystem::path& directory) {
  std::optional<std::uint64_t> sum;
  for (const char* const suffix : {"", "-wal", "-shm"}) {
    std::error_code error;
    const std::uintmax_t bytes = std::filesystem::file_size(
        directory / (std::string(platform::linux_::kStoreFileName) + suffix), error);
    if (!error) sum = sum.value_or(0) + bytes;
  }
  return sum;
}

// A thread that ended takes its number with it. The service's threads run until its end, except
// those of single traces and captures.
std::optional<std::uint64_t> wakeUpsOf(const std::filesystem::path& process) {
  std::error_code error;
  std::filesystem::directory_iterator thread(process / "task", error);
  std::optional<std::uint64_t> sum;
  while (!error && thread != std::filesystem::directory_iterator()) {
    const auto count = numberAfter(contents(thread->path() / "status"), "voluntary_ctxt_switches");
    if (count) sum = sum.value_or(0) + *count;
    thread.increment(error);
  }
  return sum;
}

ServiceCost costOf(pid_t pid) {
  const std::filesystem::path process = "/proc/" + std::to_string(pid);
  ServiceCost cost;
  const auto ticks = cpuTicks(contents(process / "stat"));
  const auto ticksPerSecond = static_cast<double>(::sysconf(_SC_CLK_TCK));
  if (ticks && ticksPerSecond > 0) {
    cost.cpuSeconds = static_cast<double>(*ticks) / ticksPerSecond;
  }
  cost.wakeUps = wakeUpsOf(process);
  cost.bytesWritten = numberAfter(contents(process / "io"), "write_bytes");
  return cost;
}

// Asks the service. What it does not answer stays empty.
TopReadings readService(const std::string& socket, std::chrono::milliseconds timeout,
                        std::string& socketPath) {
  TopReadings readings;
  const auto opened = client::HalvoxConnection::open(socket, timeout);
  if (!opened) {
    readings.problem = opened.failure->message;
    return readings;
  }
  client::HalvoxConnection& connection = **opened.value;
  socketPath = connection.socketPath();
  const auto sessions = connection.getAllReporters();
  if (!sessions) {
    readings.problem = sessions.failure->message;
    return readings;
  }
  readings.isConnected = true;
  readings.sessions = sessions.value->size();
  const auto counters = connection.getCounters();
  if (!counters) {
    readings.problem = "no counters: " + counters.failure->message;
    return readings;
  }
  CounterValues& values = readings.counters.emplace();
  for (const auto& [name, value] : *counters.value) {
    values.emplace(std::string(name.text()), value.toUInt64());
  }
  return readings;
}

// All counters of a service begin at 0 when it starts. The rates between that moment and now are
// the means since the start.
TopSnapshot sinceStart(TopReadings readings) {
  TopModel model;
  TopReadings start;
  start.counters.emplace();
  model.onTurn(std::move(start));
  readings.steady = readings.uptimeSeconds.value_or(0);
  model.onTurn(std::move(readings));
  return model.snapshot();
}

ServicePlaces placesOf(const Configuration& configuration) {
  const auto& storage = configuration.storage;
  ServicePlaces places;
  const std::filesystem::path file = platform::linux_::configurationPath();
  std::error_code error;
  places.configuration = file.string();
  places.hasConfiguration = std::filesystem::exists(file, error);
  places.socket = configuration.listener.socket.string();
  places.database = (storage.directory / platform::linux_::kStoreFileName).string();
  places.summaries = storage.root.string();
  places.captures = (storage.directory / "snapshots").string();
  return places;
}

// Empty if the configuration leaves the part on. The service loads the link to NATS only if it is
// the one in use, and the trace points also for its own traces.
std::string settingThatSwitchesOff(std::string_view option, const Configuration& configuration) {
  const bool isTraced = isTracingOn(configuration);
  if (option == "HALVOX_ALSA" && !configuration.drivers.alsa) return "drivers.alsa is false";
  if (option == "HALVOX_PIPEWIRE" && !configuration.drivers.pipewire) {
    return "drivers.pipewire is false";
  }
  if (option == "HALVOX_NATS" && configuration.link.backend != LinkBackend::kNats) {
    return "link.backend is not \"nats\"";
  }
  if (option == "HALVOX_WITH_LTTNG" && !configuration.tracePoints && !isTraced) {
    return "diagnostics.trace_points is not true";
  }
  if (option == "HALVOX_TRACING" && !isTraced) return "features.Acoustat.Tracing is not true";
  return "";
}

}  // namespace

std::optional<std::uint64_t> cpuTicks(std::string_view stat) {
  // The command may contain blanks and parentheses, and ends with the last parenthesis. The field
  // after it is the third; user and system time are the fields 14 and 15.
  constexpr int kFieldsBefore = 11;
  const std::size_t end = stat.rfind(')');
  if (end == std::string_view::npos || end + 2 > stat.size()) return std::nullopt;
  stat.remove_prefix(end + 2);
  std::uint64_t ticks = 0;
  for (int field = 0; field < kFieldsBefore + 2; ++field) {
    const std::size_t length = std::min(stat.find(' '), stat.size());
    if (field >= kFieldsBefore) {
      std::uint64_t value = 0;
      const auto read = std::from_chars(stat.data(), stat.data() + length, value);
      if (read.ec != std::errc()) return std::nullopt;
      ticks += value;
    }
    stat.remove_prefix(std::min(length + 1, stat.size()));
  }
  return ticks;
}

std::optional<std::uint64_t> numberAfter(std::string_view text, std::string_view name) {
  while (!text.empty()) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    std::string_view line = text.substr(0, end);
    text.remove_prefix(std::min(end + 1, text.size()));
    if (!line.starts_with(name) || !line.substr(name.size()).starts_with(':')) continue;
    line.remove_prefix(std::min(line.find_first_of("0123456789", name.size()), line.size()));
    std::uint64_t value = 0;
    const auto read = std::from_chars(line.data(), line.data() + line.size(), value);
    if (read.ec != std::errc()) return std::nullopt;
    return value;
  }
  return std::nullopt;
}

std::vector<SwitchedOff> switchedOff(const Configuration& configuration,
                                     std::span<const OptionalPart> parts) {
  std::vector<SwitchedOff> off;
  if (configuration.link.backend == LinkBackend::kNone) {
    off.push_back({"real-time link", "link.backend is \"none\""});
  }
  const auto& wanted = configuration.analytics.wanted;
  if (std::ranges::find(wanted, "*") == wanted.end()) {
    off.push_back({"some events", "analytics.wanted does not contain \"*\""});
  }
  if (configuration.listener.bus == BusKind::kNone) {
    off.push_back({"message bus", "listener.bus is \"none\""});
  }
  if (!isInternalBuild(configuration)) {
    off.push_back({"summary files, captures", "device.InternalBuild is not true"});
  }
  for (const OptionalPart& part : parts) {
    std::string setting = settingThatSwitchesOff(part.option, configuration);
    if (!setting.empty()) {
      off.push_back({std::string(part.name), std::move(setting)});
    } else if (!part.isBuilt) {
      off.push_back({std::string(part.name), "this build has no " + std::string(part.option)});
    }
  }
  return off;
}

ServiceStatus readStatus(const Configuration& configuration, const std::string& socket,
                         std::chrono::milliseconds timeout) {
  const auto& storage = configuration.storage;
  ServiceStatus status;
  status.now = timeNow();
  status.version = platform::linux_::halvoxVersion();
  status.places = placesOf(configuration);
  TopReadings readings = readService(socket, timeout, status.places.socket);
  const auto server = platform::linux_::storeServer(storage.directory);
  if (readings.isConnected) {
    if (server.start) readings.uptimeSeconds = bootSeconds() - *server.start;
    status.process = server.process;
  }
  if (status.process) status.cost = costOf(*server.process);
  readings.storeBytes = storeBytes(storage.directory);
  TopSnapshot snapshot = sinceStart(std::move(readings));
  status.service = std::move(snapshot.service);
  status.losses = std::move(snapshot.losses);
  status.summaryBytes = bytesBelow(storage.root);
  status.captureBytes = bytesBelow(storage.directory / "snapshots");
  status.storeLimitBytes = storage.maxMegabytes * kMebibyte;
  status.retentionDays = storage.retentionDays;
  status.keptCaptures = configuration.keepSnapshots;
  status.off = switchedOff(configuration, platform::linux_::serviceParts());
  return status;
}

}  // namespace halvox::tools
