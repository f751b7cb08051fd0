#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

// Runs a query on a connection of its own. Returns each row as its columns joined by '|'.
[[nodiscard]] std::vector<std::string> rows(const std::filesystem::path& database,
                                            std::string_view sql);
void execute(const std::filesystem::path& database, const std::string& sql);

[[nodiscard]] std::string readFile(const std::filesystem::path& path);
void writeFile(const std::filesystem::path& path, std::string_view content);

// A fixture with a store in a scratch directory, fake platform services, and a service that sends
// events to the store.
class StoreFixture : public ::testing::Test {
 protected:
  StoreFixture() { options.directory = scratch.path() / "state" / "halvox"; }

  // Makes a store with `options` and opens it.
  Result<void, StoreError> open();
  // Opens the store; fails the test on an error.
  void start() {
    const auto opened = open();
    ASSERT_TRUE(opened) << "cannot open the store: " << opened.error().message;
  }
  // Closes the store, which first writes the waiting records.
  void stop() { store.reset(); }

  // Sends an event whose payload is {"number": number}.
  void send(std::int64_t number, const std::string& name = "com.tarno.test");
  // The same at that time, in seconds since 1970.
  void sendAt(double time, std::int64_t number);
  // Sends events of about 500 bytes.
  void sendLong(std::int64_t count);
  [[nodiscard]] bool allIsStored();
  [[nodiscard]] std::filesystem::path database() const { return options.directory / "halvox.db"; }
  // The payloads of the events that tests send, without those of the store itself.
  [[nodiscard]] std::vector<std::string> payloads() const {
    return rows(database(), "SELECT payload FROM analytics_events WHERE name != '" +
                                std::string(kLastRunEvent) + "'");
  }
  [[nodiscard]] std::vector<std::filesystem::path> setAsideFiles() const;
  [[nodiscard]] std::uint64_t counted(std::string_view name) const {
    return platform.statistics.value("analytics", name);
  }
  // The number of events that were dropped for any reason.
  [[nodiscard]] std::uint64_t dropped() const;

  ScratchDirectory scratch;
  FakePlatform platform;
  Backpressure backpressure;
  StoreOptions options;
  std::unique_ptr<SqliteStore> store;
  std::unique_ptr<SqliteAnalyticsService> service;
};

// The payload of send(number).
[[nodiscard]] std::string numbered(std::int64_t number);
// Returns a text of that length that compression shortens by at most a quarter. Each number gives a
// different text.
[[nodiscard]] std::string noise(std::uint64_t number, std::size_t length);

}  // namespace halvox::platform::linux_
