#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/log.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

enum class BusKind : std::uint8_t { kNone, kSession, kSystem };
enum class LinkBackend : std::uint8_t { kLocal, kNats, kNone };

// Feature switches by domain and name.
using FeatureSwitches =
    std::map<std::string, std::map<std::string, bool, std::less<>>, std::less<>>;

// All that the configuration file can say, with the defaults for what it does not.
// Plain data: read once at start, then only read.
struct Configuration {
  struct Listener {
    std::filesystem::path socket;
    std::uint32_t mode = 0;  // permission bits of the socket's file
    std::string group;       // whom the file is given to; empty: as it is made
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
  struct Link {
    // [link.tls]: a path that is empty was not given; the files are not looked at here.
    struct Tls {
      std::filesystem::path ca;           // who signs for the servers; empty: the system's list
      std::filesystem::path certificate;  // our own, always together with `key`
      std::filesystem::path key;
      bool verify = true;  // whether the servers' certificates are checked
    };
    LinkBackend backend = LinkBackend::kLocal;
    std::vector<std::string> servers{"nats://127.0.0.1:4222"};  // at least one
    std::string subject = "halvox";                             // what all subjects begin with
    std::string stream = "HALVOX";
    std::uint64_t replicas = 1;         // of the stream, when the service makes it
    std::optional<Tls> tls;             // none: as the servers' URLs say
    std::filesystem::path credentials;  // a NATS credentials file; empty: none
  };
  struct Drivers {
    bool alsa = true;
    std::filesystem::path alsaRoot = "/";  // /proc/asound and /sys/class/sound are below it
    bool pipewire = true;
    std::filesystem::path textfiles;  // directory of *.prom files
  };
  struct Limits {
    std::uint64_t clientHistoryMegabytes = 256;
    std::uint64_t clientSessions = 100'000;
    std::uint64_t messageReporterIDs = 10'000;  // message_reporter_ids
  };

  Listener listener;
  Storage storage;
  Analytics analytics;
  Link link;
  Limits limits;
  Drivers drivers;
  std::filesystem::path preferencesDirectory;  // [preferences]: <directory>/<user>/<domain>.toml
  std::filesystem::path notifyDirectory;       // [notify]: files that post by their names
  LogLevel logLevel = LogLevel::kDefault;
  // The least level of the lines that stay in memory for captures of diagnostics.
  LogLevel logMemoryLevel = LogLevel::kInfo;
  std::uint32_t keepSnapshots = 20;
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

// Where things are of which the file says nothing.
struct DefaultPlaces {
  std::filesystem::path socket;
  std::filesystem::path storageDirectory;
};

// Where a service puts them, by its environment: $RUNTIME_DIRECTORY, $STATE_DIRECTORY, $XDG_...
DefaultPlaces placesOfService();

// The configuration of an absent file: all defaults.
Configuration defaultConfiguration(const DefaultPlaces& places = placesOfService());

// Reads the configuration from the file that the environment names. A missing file means all
// defaults, but a file that $HALVOX_CONFIG names must exist. Of several mistakes the first in the
// file is told.
std::variant<Configuration, ConfigurationError> loadConfiguration(
    const DefaultPlaces& places = placesOfService());

// The socket that the configuration names, for programs that look for the service; empty when it
// names none, and when the file is one that nobody named and that this user may not read, as the
// system's may be.
std::variant<std::filesystem::path, ConfigurationError> configuredSocket();

}  // namespace halvox::platform::linux_
