#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <variant>
#include <vector>

#include "platform/log.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

enum class BusKind : std::uint8_t { kNone, kSession, kSystem };

// Feature switches by domain and name.
using FeatureSwitches =
    std::map<std::string, std::map<std::string, bool, std::less<>>, std::less<>>;

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
  Dictionary device;         // [device]: property to value
  FeatureSwitches features;  // [features.Domain]: name to switch
};

// Why a configuration was not taken. `description` is one line for the user: for a wrong file
// "FILE:LINE:COLUMN: KEY: expected X, found Y", for an unreadable one the file and the reason.
struct ConfigurationError {
  enum class Kind : std::uint8_t {
    kWrong,       // the file's content: exit status 78
    kUnreadable,  // there is no reading it: exit status 66
  };
  Kind kind = Kind::kWrong;
  std::string description;
};

// The file that the environment names: $HALVOX_CONFIG, else $XDG_CONFIG_HOME/halvox/halvox.toml
// (~/.config when unset), else /etc/halvox/halvox.toml.
std::filesystem::path configurationPath();

// The configuration of an absent file: all defaults, those of the environment included.
Configuration defaultConfiguration();

// Reads the configuration from the file that the environment names, with defaults from the
// environment ($RUNTIME_DIRECTORY, $STATE_DIRECTORY, $XDG_...). A missing file means all defaults,
// but a file that $HALVOX_CONFIG names must exist. Of several mistakes the first in the file is
// told.
std::variant<Configuration, ConfigurationError> loadConfiguration();

}  // namespace halvox::platform::linux_
