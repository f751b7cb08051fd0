#pragma once

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "client/HalvoxClient.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/top/TopModel.h"

namespace halvox::tools {

// Where `halvoxctl top` reads.
struct TopPlaces {
  std::filesystem::path store;
  // Empty if the store is a copy: no service belongs to it then.
  std::optional<std::string> socket;  // an empty text stands for the usual places
  std::chrono::milliseconds timeout{};
  std::optional<platform::linux_::Configuration::Drivers> drivers;
};

// Reads the store, the counters of the service and those of the drivers, one turn after the other.
// Changes nothing and makes no process do anything between turns: it reads only the records that
// were stored since the turn before, and asks the service for two answers. What cannot be read is
// shown as a problem and tried again in the next turn. Belongs to one thread.
//
//   open(); readTurn() as often as wanted
class TopSource {
 public:
  explicit TopSource(TopPlaces places);
  TopSource(const TopSource&) = delete;
  TopSource& operator=(const TopSource&) = delete;
  ~TopSource();

  // Opens the store, connects to the service and opens the drivers. Fails with a text for a person
  // if there is neither a store nor a service.
  platform::linux_::Result<void> open();
  // Reads everything that is new into the model. Blocks on the disk, at most for the time-out on
  // the service, and for 50 ms on the drivers. The first turn reads the records since the start of
  // the service, because streams that run may have begun then.
  void readTurn(TopModel& model);

 private:
  class Drivers;

  void readStore(TopModel& model, TopReadings& readings);
  [[nodiscard]] std::optional<double> firstTime() const;
  void readService(TopModel& model, TopReadings& readings);
  [[nodiscard]] platform::linux_::Result<void> connect();
  [[nodiscard]] std::optional<std::uint64_t> storeBytes() const;

  TopPlaces places_;
  platform::linux_::StoreReader reader_;
  bool isStoreOpen_ = false;
  bool hasRead_ = false;
  std::int64_t lastRead_ = 0;
  std::unique_ptr<client::HalvoxConnection> connection_;
  std::optional<double> serviceStart_;  // by CLOCK_BOOTTIME, in seconds
  std::unique_ptr<Drivers> drivers_;
};

}  // namespace halvox::tools
