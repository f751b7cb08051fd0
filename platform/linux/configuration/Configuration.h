#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/configuration/Defaults.h"
#include "platform/log.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

enum class BusKind : std::uint8_t { kNone, kSession, kSystem };
enum class LinkBackend : std::uint8_t { kLocal, kNats, kNone };

// Feature switches by domain and name.
using FeatureSwitches =
    std::map<std::string, std::map<std::string, bool, std::less<>>, std::less<>>;

// The settings of the configuration file, with defaults for absent ones. Units are in the names or
// in Defaults.h; docs/configuration.md describes each key. Plain data: filled once at the start,
// then only read, by any thread.
struct Configuration {
  struct Listener {
    std::filesystem::path socket;
    std::uint32_t mode = 0;  // permission bits of the socket's file
    std::string group;       // owns the socket's file; empty: unchanged
    BusKind bus = BusKind::kNone;
    std::chrono::milliseconds handshakeTimeout{defaults::kHandshakeTimeout};  // handshake_seconds
    std::chrono::milliseconds messageTimeout{defaults::kMessageTimeout};      // message_seconds
  };
  struct Storage {
    std::filesystem::path directory;
    std::filesystem::path root;
    std::uint32_t retentionDays = defaults::kRetentionDays;
    std::uint32_t maxMegabytes = defaults::kStorageMegabytes;
  };
  struct Analytics {
    std::vector<std::string> wanted{defaults::kWantedEvents};  // glob patterns of event names
  };
  struct Link {
    // [link.tls]. An empty path means that the key is absent. The files are read when the link
    // connects, not here.
    struct Tls {
      std::filesystem::path ca;           // trusted authorities; empty: the system's
      std::filesystem::path certificate;  // the service's own; always together with `key`
      std::filesystem::path key;
      bool verify = true;  // whether the servers' certificates are checked
    };
    LinkBackend backend = LinkBackend::kLocal;
    std::vector<std::string> servers{"nats://127.0.0.1:4222"};  // at least one
    std::string subject = "halvox";                             // first part of all subjects
    std::string stream = "HALVOX";
    std::uint64_t replicas = defaults::kStreamReplicas;  // of a stream that the service creates
    bool spool = true;       // whether the store keeps messages while no server takes them
    std::optional<Tls> tls;  // none: TLS if a server's URL asks for it
    std::filesystem::path credentials;  // a NATS credentials file; empty: none
  };
  struct Drivers {
    bool alsa = true;
    std::filesystem::path alsaRoot = "/";  // contains proc/asound and sys/class/sound
    bool pipewire = true;
    std::filesystem::path textfiles;  // directory of *.prom files
  };
  struct Limits {
    std::uint64_t clientHistoryMegabytes = defaults::kClientHistoryMegabytes;
    std::uint64_t clientSessions = defaults::kClientSessions;
    std::uint64_t messageReporterIDs = defaults::kMessageReporterIDs;  // message_reporter_ids
  };

  struct Privacy {
    std::vector<std::string> dropKeys;  // drop_keys: glob patterns
  };

  Listener listener;
  Storage storage;
  Analytics analytics;
  Link link;
  Limits limits;
  Drivers drivers;
  Privacy privacy;
  std::filesystem::path preferencesDirectory;  // [preferences]: <directory>/<user>/<domain>.toml
  std::filesystem::path notifyDirectory;       // [notify]: each file stands for a notification
  LogLevel logLevel = LogLevel::kDefault;
  // The lowest level of the lines that the log keeps in memory for captures of diagnostics.
  LogLevel logMemoryLevel = LogLevel::kInfo;
  std::uint32_t keepSnapshots = defaults::kKeptSnapshots;
  bool tracePoints = false;  // diagnostics.trace_points
  Dictionary device;         // [device]: property to value
  FeatureSwitches features;  // [features.Domain]: name to switch
};

// Why a configuration cannot be used. The message of a failure with this code is one line for the
// user: for a file with a mistake "FILE:LINE:COLUMN: KEY: expected X, found Y", for an unreadable
// file its name and the reason.
enum class ConfigurationError : std::uint8_t {
  kWrong,       // a mistake in the file: exit status 78
  kUnreadable,  // the file cannot be read: exit status 66
};

// The file that the environment names: $HALVOX_CONFIG, else $XDG_CONFIG_HOME/halvox/halvox.toml
// (~/.config when unset), else /etc/halvox/halvox.toml.
std::filesystem::path configurationPath();

// The paths that the service uses if the file does not name others.
struct DefaultPlaces {
  std::filesystem::path socket;
  std::filesystem::path storageDirectory;
};

// The default places of a service, from its environment: $RUNTIME_DIRECTORY and $STATE_DIRECTORY,
// else $XDG_RUNTIME_DIR and $XDG_STATE_HOME.
DefaultPlaces placesOfService();

// The configuration without a file: all defaults.
Configuration defaultConfiguration(const DefaultPlaces& places = placesOfService());

// Reads the file of configurationPath(). Without a file all settings have their defaults, but a
// file that $HALVOX_CONFIG names must exist. Of several mistakes, the first in the file is
// returned.
Result<Configuration, ConfigurationError> loadConfiguration(
    const DefaultPlaces& places = placesOfService());

// Returns the socket that the configuration names, for programs that look for the service; empty if
// it names none. Also empty if this user may not read the file and $HALVOX_CONFIG does not name it,
// because the system's file may be readable only by the service.
Result<std::filesystem::path, ConfigurationError> configuredSocket();

}  // namespace halvox::platform::linux_
