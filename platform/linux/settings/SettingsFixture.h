#pragma once

#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

// A fixture with directories for preferences and notifications. Neither exists at first.
class SettingsFixture : public testing::Test {
 protected:
  [[nodiscard]] std::filesystem::path preferences() const { return scratch_ / "preferences"; }
  [[nodiscard]] std::filesystem::path notify() const { return scratch_ / "notify"; }
  [[nodiscard]] std::filesystem::path domainFile(const std::string& domain) const {
    return preferences() / "mobile" / (domain + ".toml");
  }
  static void write(const std::filesystem::path& file, std::string_view text) {
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary | std::ios::trunc) << text;
  }
  static std::string read(const std::filesystem::path& file) {
    std::ifstream stream(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
  }
  // Returns the number of log lines that contain a text.
  [[nodiscard]] std::size_t linesWith(std::string_view text) const {
    std::size_t count = 0;
    for (const auto& line : platform_.log.texts()) count += line.find(text) != std::string::npos;
    return count;
  }

  FakePlatform platform_;
  const ScratchDirectory directory_;
  std::filesystem::path scratch_ = directory_.path();
};

}  // namespace halvox::platform::linux_
