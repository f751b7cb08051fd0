#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>
#include <set>
#include <sstream>
#include <string>

#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/linux/configuration/Configuration.h"

// Compares docs/configuration.md with the keys and defaults of the service.

namespace halvox::platform::linux_ {
namespace {

using Keys = std::set<std::string>;

std::string readFile(const std::string& file) {
  std::ifstream stream(file);
  return {std::istreambuf_iterator<char>(stream), {}};
}

Keys allMatches(const std::string& text, const std::regex& pattern) {
  const std::sregex_iterator begin(text.begin(), text.end(), pattern);
  Keys keys;
  for (auto match = begin; match != std::sregex_iterator(); ++match) keys.insert((*match)[1].str());
  return keys;
}

// The names in the first columns of the page's tables. A cell can have several.
Keys documentedKeys() {
  Keys keys;
  std::istringstream lines(readFile(HALVOX_CONFIGURATION_PAGE));
  static const std::regex kRow("^\\| `[a-z_]+`");
  static const std::regex kName("`([a-z_]+)`");
  for (std::string line; std::getline(lines, line);) {
    if (std::regex_search(line, kRow))
      keys.merge(allMatches(line.substr(0, line.find('|', 1)), kName));
  }
  return keys;
}

// A file with the page's default for every key whose default is a TOML value.
std::string documentedDefaults() {
  std::istringstream lines(readFile(HALVOX_CONFIGURATION_PAGE));
  static const std::regex kHeading("^### `(\\[[a-z]+\\])`$");
  static const std::regex kDefault(
      R"(^\| `([a-z_]+)` \| `([0-9]+|true|false|"[^`]*"|\[[^`]*\])` \|)");
  std::string text;
  bool isInTable = false;
  for (std::string line; std::getline(lines, line);) {
    std::smatch match;
    if (line.starts_with("### ")) {
      // Skip [link.tls], because its presence alone changes the configuration.
      isInTable = std::regex_match(line, match, kHeading);
      if (isInTable) text += match[1].str() + "\n";
    } else if (isInTable && std::regex_search(line, match, kDefault)) {
      text += match[1].str() + " = " + match[2].str() + "\n";
    }
  }
  return text;
}

TEST(ConfigurationDocumentTest, ThePageHasTheKeysThatAreReadAndNoOthers) {
  // table.read("key", …) and readLogLevel(table, "key", …).
  static const std::regex kRead(R"x(\bread[A-Za-z]*\((?:table, )?"([a-z_]+)")x");
  const Keys read = allMatches(readFile(HALVOX_CONFIGURATION_SOURCE), kRead);

  ASSERT_GT(read.size(), 20U);
  EXPECT_EQ(documentedKeys(), read);
}

TEST(ConfigurationDocumentTest, TheDefaultsOfThePageAreTheDefaults) {
  const std::string text = documentedDefaults();
  const auto file = std::filesystem::path(testing::TempDir()) /
                    ("halvox-documented-" + std::to_string(::getpid()) + ".toml");
  std::ofstream(file) << text;
  const char* named = std::getenv("HALVOX_CONFIG");
  const std::string before = named == nullptr ? "" : named;
  ::setenv("HALVOX_CONFIG", file.c_str(), 1);
  const auto result = loadConfiguration();
  named == nullptr ? ::unsetenv("HALVOX_CONFIG") : ::setenv("HALVOX_CONFIG", before.c_str(), 1);
  std::filesystem::remove(file);

  ASSERT_TRUE(result) << result.error().message << '\n' << text;
  ASSERT_NE(text.find("retention_days = "), std::string::npos) << text;
  const Configuration& page = *result;
  const Configuration none = defaultConfiguration();
  EXPECT_EQ(page.listener.bus, none.listener.bus);
  EXPECT_EQ(page.listener.handshakeTimeout, none.listener.handshakeTimeout);
  EXPECT_EQ(page.listener.messageTimeout, none.listener.messageTimeout);
  EXPECT_EQ(page.storage.retentionDays, none.storage.retentionDays);
  EXPECT_EQ(page.storage.maxMegabytes, none.storage.maxMegabytes);
  EXPECT_EQ(page.analytics.wanted, none.analytics.wanted);
  EXPECT_EQ(page.link.backend, none.link.backend);
  EXPECT_EQ(page.link.servers, none.link.servers);
  EXPECT_EQ(page.link.subject, none.link.subject);
  EXPECT_EQ(page.link.stream, none.link.stream);
  EXPECT_EQ(page.link.replicas, none.link.replicas);
  EXPECT_EQ(page.link.spool, none.link.spool);
  EXPECT_EQ(page.drivers.alsa, none.drivers.alsa);
  EXPECT_EQ(page.drivers.alsaRoot, none.drivers.alsaRoot);
  EXPECT_EQ(page.drivers.pipewire, none.drivers.pipewire);
  EXPECT_EQ(page.limits.clientHistoryMegabytes, none.limits.clientHistoryMegabytes);
  EXPECT_EQ(page.limits.clientSessions, none.limits.clientSessions);
  EXPECT_EQ(page.limits.messageReporterIDs, none.limits.messageReporterIDs);
  EXPECT_EQ(page.logLevel, none.logLevel);
  EXPECT_EQ(page.logMemoryLevel, none.logMemoryLevel);
  EXPECT_EQ(page.keepSnapshots, none.keepSnapshots);
  EXPECT_EQ(page.tracePoints, none.tracePoints);
}

}  // namespace
}  // namespace halvox::platform::linux_
