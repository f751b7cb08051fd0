#pragma once

#include <chrono>
#include <filesystem>
#include <future>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/diagnostics/SnapshotDiagnosticReporterService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

void writeText(const std::filesystem::path& file, std::string_view text);
[[nodiscard]] std::string readText(const std::filesystem::path& file);

// Returns the files of an archive by name, read with libarchive alone.
[[nodiscard]] std::map<std::string, std::string> archiveFiles(const std::filesystem::path& file);
// Writes an archive of the same format. Its entries may be ones that this program never writes.
struct TestEntry {
  std::string name;
  std::string text{};
  std::string linkTarget{};  // not empty: a symbolic link
};
void writeArchive(const std::filesystem::path& file, const std::vector<TestEntry>& entries);

// A fixture with a service on fake platform services, in a scratch directory, and with paths of its
// own in place of /proc and the others.
class SnapshotFixture : public ::testing::Test {
 protected:
  SnapshotFixture();

  void start() {
    service = std::make_unique<SnapshotDiagnosticReporterService>(
        options, SnapshotPartners{.log = platform.log,
                                  .statistics = platform.statistics,
                                  .keptLines = log,
                                  .recorder = recorder});
  }
  // Requests a snapshot and returns the future response.
  [[nodiscard]] std::future<Dictionary> request(const std::string& process = "player");
  // Requests a snapshot and waits for the response.
  [[nodiscard]] Dictionary snapshot(const std::string& process = "player") {
    return responseOf(request(process));
  }
  [[nodiscard]] static Dictionary responseOf(std::future<Dictionary> response);
  [[nodiscard]] static std::string textOf(const Dictionary& response, const char* key);
  [[nodiscard]] std::filesystem::path directory() const {
    return options.storageDirectory / "snapshots";
  }
  // Returns the names in the directory of snapshots, sorted.
  [[nodiscard]] std::vector<std::string> names() const;
  [[nodiscard]] std::uint64_t counted(std::string_view name) const {
    return platform.statistics.value("diagnostics", name);
  }
  void expectBalance() const {
    EXPECT_EQ(counted("received"), counted("delivered") + counted("dropped: another in progress") +
                                       counted("dropped: cannot be written") +
                                       counted("dropped: service ending"));
  }

  ScratchDirectory scratch;
  FakePlatform platform;
  SnapshotOptions options;
  std::function<LogMemory::Contents()> log;
  SnapshotRecorder* recorder = nullptr;
  std::unique_ptr<SnapshotDiagnosticReporterService> service;
};

}  // namespace halvox::platform::linux_
