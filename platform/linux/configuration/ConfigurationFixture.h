#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <utility>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

inline constexpr const char* kVariables[] = {"HALVOX_CONFIG",
                                             "XDG_CONFIG_HOME",
                                             "RUNTIME_DIRECTORY",
                                             "XDG_RUNTIME_DIR",
                                             "STATE_DIRECTORY",
                                             "XDG_STATE_HOME",
                                             "HOME"};

// Uses a scratch directory as the home directory and unsets all other variables that the
// configuration reads.
class ConfigurationFixture : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const char* variable : kVariables) {
      if (const char* value = std::getenv(variable)) saved_[variable] = value;
      ::unsetenv(variable);
    }
    ::setenv("HOME", directory_.c_str(), 1);
  }
  void TearDown() override {
    for (const char* variable : kVariables) ::unsetenv(variable);
    for (const auto& [variable, value] : saved_) ::setenv(variable.c_str(), value.c_str(), 1);
  }

  std::filesystem::path write(std::string_view text, const std::string& name = "halvox.toml") {
    std::filesystem::path file = directory_ / name;
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary) << text;
    return file;
  }
  Result<Configuration, ConfigurationError> load(std::string_view text) {
    ::setenv("HALVOX_CONFIG", write(text).c_str(), 1);
    return loadConfiguration();
  }
  Configuration loaded(std::string_view text) {
    auto result = load(text);
    if (result) return *std::move(result);
    ADD_FAILURE() << result.error().message;
    return {};
  }
  // The error for a file with `text`, without the file's name.
  std::string mistake(std::string_view text) {
    const auto result = load(text);
    if (result) return "(none)";
    EXPECT_EQ(result.error().code, ConfigurationError::kWrong);
    const std::string prefix = (directory_ / "halvox.toml").native() + ":";
    EXPECT_THAT(result.error().message, ::testing::StartsWith(prefix));
    return result.error().message.substr(prefix.size());
  }

  const ScratchDirectory scratch_;
  const std::filesystem::path directory_ = scratch_.path();
  std::map<std::string, std::string> saved_;
};

}  // namespace halvox::platform::linux_
