// Runs the contract suites of analytics, metrics and the power log on the services that record in
// the store.

#include <memory>
#include <stdexcept>

#include "platform/fake/FakePlatform.h"
#include "platform/fake/contracts/AnalyticsContract.h"
#include "platform/fake/contracts/MetricContract.h"
#include "platform/fake/contracts/PowerLogContract.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteMetricService.h"
#include "platform/linux/store/SqlitePowerLogService.h"
#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::contract {
namespace {

using linux_::SqliteAnalyticsService;
using linux_::SqliteMetricService;
using linux_::SqlitePowerLogService;

// A store in a scratch directory.
class OpenStore {
 public:
  explicit OpenStore(std::vector<std::string> wanted = {"*"}) {
    linux_::StoreOptions options;
    options.directory = scratch_.path() / "state";
    options.wantedEvents = std::move(wanted);
    store_ = std::make_unique<linux_::SqliteStore>(
        options,
        linux_::SqliteStore::Environment{platform_.clock, platform_.statistics, backpressure_});
    if (const auto opened = store_->open(); !opened) {
      throw std::runtime_error(opened.error().message);
    }
  }

  linux_::SqliteStore& store() { return *store_; }
  const ClockService& clock() const { return platform_.clock; }
  // Closes the store, which then writes everything. Returns the rows of a query, with their columns
  // joined by '|'.
  std::vector<std::string> rows(std::string_view query) {
    store_->close();
    return linux_::rows(scratch_.path() / "state" / "halvox.db", query);
  }

 private:
  linux_::ScratchDirectory scratch_;
  FakePlatform platform_;
  linux_::Backpressure backpressure_;
  std::unique_ptr<linux_::SqliteStore> store_;
};

// Removes the first column and its separator from a row, and returns the column.
std::string takeColumn(std::string& row) {
  const std::size_t end = row.find('|');
  std::string column = row.substr(0, end);
  row.erase(0, end == std::string::npos ? end : end + 1);
  return column;
}

std::int64_t numberIn(const std::string& column) { return std::stoll(column); }

class AnalyticsHarness {
 public:
  explicit AnalyticsHarness(std::vector<std::string> wanted) : store_(std::move(wanted)) {}
  AnalyticsService& service() { return service_; }
  std::vector<RecordedEvent> recorded() {
    std::vector<RecordedEvent> result;
    for (std::string row :
         store_.rows("SELECT name, json_extract(payload, '$.number') FROM analytics_events")) {
      std::string name = takeColumn(row);
      result.emplace_back(std::move(name), numberIn(row));
    }
    return result;
  }

 private:
  OpenStore store_;
  SqliteAnalyticsService service_{store_.store(), store_.clock()};
};

class MetricHarness {
 public:
  MetricService& service() { return service_; }
  std::vector<RecordedMetric> recorded() {
    std::vector<RecordedMetric> result;
    for (std::string row : store_.rows("SELECT metric_id, hex(message) FROM issue_metrics")) {
      const std::int64_t metricID = numberIn(takeColumn(row));
      result.emplace_back(static_cast<std::uint32_t>(metricID), bytesOf(row));
    }
    return result;
  }

 private:
  static std::string bytesOf(const std::string& hex) {
    constexpr int kHexadecimal = 16;
    std::string bytes;
    for (std::size_t at = 0; at + 1 < hex.size(); at += 2) {
      bytes += static_cast<char>(std::stoi(hex.substr(at, 2), nullptr, kHexadecimal));
    }
    return bytes;
  }

  OpenStore store_;
  SqliteMetricService service_{store_.store(), store_.clock()};
};

class PowerLogHarness {
 public:
  PowerLogService& service() { return service_; }
  std::vector<RecordedPowerEvent> recorded() {
    std::vector<RecordedPowerEvent> result;
    for (std::string row :
         store_.rows("SELECT category_id, event_name, ifnull(json_extract(payload, '$.a'), ''),"
                     " ifnull(json_extract(payload, '$.b'), '') FROM power_events")) {
      const auto category = static_cast<std::uint32_t>(numberIn(takeColumn(row)));
      std::string name = takeColumn(row);
      const std::optional<std::int64_t> a = optionalNumber(takeColumn(row));
      result.push_back({category, std::move(name), a, optionalNumber(row)});
    }
    return result;
  }

 private:
  static std::optional<std::int64_t> optionalNumber(const std::string& column) {
    return column.empty() ? std::nullopt : std::optional(numberIn(column));
  }

  OpenStore store_;
  SqlitePowerLogService service_{store_.store(), store_.clock()};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Sqlite, AnalyticsContract, AnalyticsHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Sqlite, MetricContract, MetricHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Sqlite, PowerLogContract, PowerLogHarness);

}  // namespace halvox::platform::contract
