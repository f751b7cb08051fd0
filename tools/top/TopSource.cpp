#include "tools/top/TopSource.h"

#include <algorithm>
#include <ctime>
#include <mutex>
#include <string_view>
#include <system_error>
#include <utility>

#include "analysis/StoreRecordSource.h"

#include "platform/linux/drivers/ConfiguredSources.h"
#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/StoreUse.h"
#include "tools/top/DeviceSampler.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;
using platform::linux_::StoreUse;

// Streams of a service are counted from a little before its start: the kernel and the wall clock
// may disagree by a moment.
constexpr double kStartMargin = 5;

double secondsOf(clockid_t clock) {
  constexpr double kNanosecondsPerSecond = 1e9;
  timespec time{};
  ::clock_gettime(clock, &time);
  return static_cast<double>(time.tv_sec) +
         static_cast<double>(time.tv_nsec) / kNanosecondsPerSecond;
}

// Keeps the last error of the sources. A line on standard error would spoil the screen. Any thread.
class LastError final : public platform::LogCategory {
 public:
  LastError() : LogCategory(platform::LogLevel::kError) {}
  void write(platform::LogLevel /*level*/, std::string_view line) override {
    constexpr std::size_t kPrefix = 32;  // the unit and its line
    const std::lock_guard lock(mutex_);
    text_ = line.substr(std::min(kPrefix, line.size()));
  }
  [[nodiscard]] std::string text() {
    const std::lock_guard lock(mutex_);
    return text_;
  }

 private:
  std::mutex mutex_;
  std::string text_;
};

}  // namespace

// The sources of driver counters, which are read in this process.
class TopSource::Drivers {
 public:
  explicit Drivers(const platform::linux_::Configuration::Drivers& configuration)
      : service_(platform::linux_::makeDriverSources(configuration, error_), error_, statistics_) {
    service_.open();
  }

  [[nodiscard]] std::vector<DeviceReading> read() { return sampler_.read(); }
  [[nodiscard]] std::string problem() { return error_.text(); }

 private:
  LastError error_;
  platform::linux_::CounterStatisticsService statistics_;
  platform::linux_::LinuxIOReportService service_;
  DeviceSampler sampler_{service_};
};

TopSource::TopSource(TopPlaces places) : places_(std::move(places)) {}

TopSource::~TopSource() = default;

Result<void> TopSource::open() {
  const auto opened = reader_.open(places_.store);
  isStoreOpen_ = opened.has_value();
  const auto connected = connect();
  if (!isStoreOpen_ && !connected) return Failure<>{opened.error().message};
  if (places_.drivers) drivers_ = std::make_unique<Drivers>(*places_.drivers);
  return {};
}

Result<void> TopSource::connect() {
  if (!places_.socket) return Failure<>{""};
  auto opened = client::HalvoxConnection::open(*places_.socket, places_.timeout);
  if (!opened) return Failure<>{opened.failure->message};
  connection_ = std::move(*opened.value);
  serviceStart_ = platform::linux_::storeServer(places_.store).start;
  return {};
}

// The time of the first record to read; nothing for all of them.
std::optional<double> TopSource::firstTime() const {
  if (!places_.socket) return std::nullopt;
  const double now = secondsOf(CLOCK_REALTIME);
  const auto server = platform::linux_::storeServer(places_.store);
  // No stream of a service that has ended runs.
  if (server.use == StoreUse::kNotServed) return now;
  if (!server.start) return std::nullopt;
  return now - (secondsOf(CLOCK_BOOTTIME) - *server.start) - kStartMargin;
}

void TopSource::readStore(TopModel& model, TopReadings& readings) {
  if (isStoreOpen_ && reader_.isReplaced()) {
    isStoreOpen_ = false;
    model.forget();
  }
  if (!isStoreOpen_) {
    lastRead_ = 0;
    hasRead_ = false;
    const auto opened = reader_.open(places_.store);
    if (!opened) {
      readings.problem = opened.error().message;
      return;
    }
    isStoreOpen_ = true;
  }
  analysis::RecordRange range;
  range.after = lastRead_;
  if (!hasRead_) range.since = firstTime();
  analysis::StoreRecordSource source(reader_);
  const auto read =
      source.forEach(range, [&](const analysis::Record& record) { model.addRecord(record); });
  if (!read) {
    readings.problem = read.error().message;
    // Reading begins again with the first record, and must not meet the streams of this attempt.
    isStoreOpen_ = false;
    model.forget();
    return;
  }
  hasRead_ = true;
  lastRead_ = reader_.lastRead();
}

void TopSource::readService(TopModel& model, TopReadings& readings) {
  if (!places_.socket) {
    readings.problem = "a store without its service";
    return;
  }
  if (connection_ == nullptr) {
    if (const auto connected = connect(); !connected) {
      readings.problem = connected.error().message;
      return;
    }
  }
  const auto sessions = connection_->getAllReporters();
  if (!sessions) {
    readings.problem = sessions.failure->message;
    if (sessions.failure->kind == client::Failure::Kind::kNoService) model.forget();
    // After a time-out, too: an answer that comes late must not be taken for that of the next turn.
    connection_.reset();
    return;
  }
  readings.isConnected = true;
  readings.sessions = sessions.value->size();
  if (serviceStart_) readings.uptimeSeconds = secondsOf(CLOCK_BOOTTIME) - *serviceStart_;
  const auto counters = connection_->getCounters();
  if (!counters) {
    readings.problem = "no counters: " + counters.failure->message;
    return;
  }
  CounterValues& values = readings.counters.emplace();
  for (const auto& [name, value] : *counters.value) {
    values.emplace(std::string(name.text()), value.toUInt64());
  }
}

std::optional<std::uint64_t> TopSource::storeBytes() const {
  std::optional<std::uint64_t> sum;
  for (const char* const suffix : {"", "-wal", "-shm"}) {
    const std::string name = std::string(platform::linux_::kStoreFileName) + suffix;
    std::error_code error;
    const std::uintmax_t bytes = std::filesystem::file_size(places_.store / name, error);
    if (!error) sum = sum.value_or(0) + bytes;
  }
  return sum;
}

void TopSource::readTurn(TopModel& model) {
  TopReadings readings;
  // The service comes first: if it was started anew, the streams of the old one are forgotten
  // before the records of the new one are read.
  readService(model, readings);
  readStore(model, readings);
  if (drivers_ != nullptr) {
    readings.devices = drivers_->read();
    if (readings.problem.empty()) {
      const std::string problem = drivers_->problem();
      if (!problem.empty()) readings.problem = "drivers: " + problem;
    }
  }
  readings.storeBytes = storeBytes();
  readings.now = secondsOf(CLOCK_REALTIME);
  readings.steady = secondsOf(CLOCK_MONOTONIC);
  model.onTurn(std::move(readings));
}

}  // namespace halvox::tools
