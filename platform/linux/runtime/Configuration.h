#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/log.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

enum class BusKind : std::uint8_t { kNone, kSession, kSystem };

// All that the configuration file can say, with the defaults for what it does not.
// Plain data: read once at start, then only read.
struct Configuration {
  struct Listener {
    std::filesystem::path socket;
    BusKind bus = BusKind::kNone;
    std::chrono::milliseconds handshakeTimeout{30'000};  // handshake_seconds
    std::chrono::milliseconds messageTimeout{60'000};  // message_seconds: a message begun must end
  };
  struct Storage {
    std::filesystem::path directory;
    std::filesystem::path root;
    std::uint32_t retentionDays = 30;
    std::uint32_t maxMegabytes = 512;
  };
  struct Analytics {
    std::vector<std::string> wanted{"*"};  // glob patterns of event names
  };
  struct Limits {
    std::uint64_t clientHistoryMegabytes = 256;
    std::uint64_t clientSessions = 100'000;
  };

  Listener listener;
  Storage storage;
  Analytics analytics;
  Limits limits;
  LogLevel logLevel = LogLevel::kDefault;
  Dictionary device;                                            // [device]: property to value
  std::map<std::string, std::map<std::string, bool>> features;  // [features.Domain]: name to switch
};

// Why a configuration was not taken. `description` is one line for the user: file, line, column,
// the key and what was expected of it.
struct ConfigurationError {
  std::string description;
};

// The file that the environment names: $HALVOX_CONFIG, else $XDG_CONFIG_HOME/halvox/halvox.toml
// (~/.config when unset), else /etc/halvox/halvox.toml.
std::filesystem::path configurationPath();

// Reads the configuration from the file that the environment names, with defaults from the
// environment ($RUNTIME_DIRECTORY, $STATE_DIRECTORY, $XDG_...). A missing file means all defaults,
// but a file that $HALVOX_CONFIG names must exist.
std::variant<Configuration, ConfigurationError> loadConfiguration();

}  // namespace halvox::platform::linux_
