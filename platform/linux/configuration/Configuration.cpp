#include "platform/linux/configuration/Configuration.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <limits>

#include <fmt/format.h>
#include <sys/un.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/base/WholeFile.h"
#include "platform/linux/configuration/ConfigurationEnvironment.h"
#include "platform/linux/configuration/ConfigurationReader.h"
#include "platform/linux/configuration/TomlTrouble.h"

namespace halvox::platform::linux_ {
namespace {

// A wrong path, such as that of a device, must not fill the memory at the start.
constexpr std::size_t kLargestFile = 1U << 20U;
// Less than PATH_MAX, to leave room for the names of files below the path.
constexpr std::size_t kLongestPath = 4000;
constexpr std::size_t kLongestSocketPath = sizeof(sockaddr_un::sun_path) - 1;
constexpr std::size_t kLongestStreamName = 255;  // the server uses it as the name of a directory
// A hundred years and a tebibyte. Within these, seconds and bytes fit into 64 bits.
constexpr NumberRange kDays{1, 36'500};
constexpr NumberRange kMegabytes{1, 1U << 20U};
constexpr NumberRange kReplicas{1, 5};  // what JetStream accepts
constexpr NumberRange kSessions{1, 1'000'000'000};
// A message to 10,000 sessions delays all other requests for some hundredths of a second, one to
// 1,000,000 for seconds.
constexpr NumberRange kReporterIDs{1, 1'000'000};
constexpr NumberRange kSnapshots{1, 10'000};

const char* configurationVariable() {
  const char* named = std::getenv("HALVOX_CONFIG");
  return named != nullptr && *named != '\0' ? named : nullptr;
}

std::string oneLine(std::string_view text) {
  std::string line;
  appendEscaped(line, text, std::numeric_limits<std::size_t>::max());
  return line;
}

Failure<ConfigurationError> unreadable(const std::filesystem::path& file, int error) {
  return {ConfigurationError::kUnreadable,
          oneLine(fmt::format("{}: the configuration cannot be read: {}", file.native(),
                              errnoText(error)))};
}

// Returns the file's text, or std::nullopt if the file does not exist. The file may be a pipe, such
// as the one that a shell makes of <(command). Opening a pipe does not block, because a pipe
// without a writer must not delay the start.
Result<std::optional<std::string>, ConfigurationError> readText(const std::filesystem::path& file) {
  FileContent content =
      readWholeFile({.path = file.c_str(), .most = kLargestFile, .kinds = FileToRead::Kinds::kAny});
  switch (content.outcome) {
    case FileContent::Outcome::kRead:
      return std::move(content.bytes);
    case FileContent::Outcome::kMissing:
      return std::nullopt;
    case FileContent::Outcome::kTooLarge:
      return Failure<ConfigurationError>{
          ConfigurationError::kWrong,
          oneLine(fmt::format("{}:1:1: the file: expected at most {} bytes, found more",
                              file.native(), kLargestFile))};
    case FileContent::Outcome::kNotRegular:
    case FileContent::Outcome::kFailed:
      break;
  }
  return unreadable(file, content.error);
}

bool isNotEmpty(std::string_view text) { return !text.empty(); }

// A mode is a zero and three octal digits, of which the first must let the owner connect.
bool isMode(std::string_view text) {
  return text.size() == 4 && text[0] == '0' && (text[1] == '6' || text[1] == '7') &&
         std::ranges::all_of(text, [](char digit) { return digit >= '0' && digit <= '7'; });
}

// Returns the mode that applies without a setting. If a group is set, its members may connect. A
// socket in the runtime directory of a login is for that user only. The socket of a system service
// is for all users, because the programs of all users report.
std::uint32_t defaultMode(const Configuration::Listener& listener) {
  constexpr std::uint32_t kUser = 0600;
  constexpr std::uint32_t kGroup = 0660;
  if (!listener.group.empty()) return kGroup;
  const auto login = environmentPath("XDG_RUNTIME_DIR");
  return login.has_value() && isBelow(listener.socket, *login) ? kUser
                                                               : defaults::kSocketModeOfSystem;
}

void readMode(TableReader& table, Configuration::Listener& listener) {
  constexpr int kOctal = 8;
  std::string mode;
  table.readText("mode", isMode, "permissions such as \"0660\", from \"0600\" to \"0777\"", mode);
  listener.mode = mode.empty() ? defaultMode(listener)
                               : static_cast<std::uint32_t>(std::stoul(mode, nullptr, kOctal));
}

void readListener(TableReader table, Configuration::Listener& listener) {
  table.read("socket", listener.socket, kLongestSocketPath);
  table.readText("group", isNotEmpty, "the name of a group", listener.group);
  readMode(table, listener);
  auto bus = static_cast<std::size_t>(listener.bus);
  table.readChoice("bus", {"none", "session", "system"}, bus);
  listener.bus = static_cast<BusKind>(bus);
  table.readSeconds("handshake_seconds", listener.handshakeTimeout);
  table.readSeconds("message_seconds", listener.messageTimeout);
  table.finish();
}

void readStorage(TableReader table, Configuration::Storage& storage) {
  std::filesystem::path root;
  std::uint64_t days = storage.retentionDays;
  std::uint64_t megabytes = storage.maxMegabytes;
  table.read("directory", storage.directory, kLongestPath);
  table.read("root", root, kLongestPath);
  table.read("retention_days", kDays, days);
  table.read("max_megabytes", kMegabytes, megabytes);
  table.finish();
  // Set last, because the default depends on the directory that the file names.
  storage.root = root.empty() ? storage.directory / "root" : root;
  storage.retentionDays = static_cast<std::uint32_t>(days);
  storage.maxMegabytes = static_cast<std::uint32_t>(megabytes);
}

void readAnalytics(TableReader table, Configuration::Analytics& analytics) {
  std::size_t sink = 0;
  table.read("wanted", analytics.wanted);
  // Read the key although it has only one valid value. If a file asks for another sink, the service
  // must not start and send events elsewhere.
  table.readChoice("sink", {"sqlite"}, sink);
  table.finish();
}

// Printable ASCII without blanks, because the NATS protocol separates names by blanks.
bool isGraphic(std::string_view text) {
  return !text.empty() && std::ranges::all_of(text, [](char character) {
    return character > ' ' && character <= '~';
  });
}

bool isServerURL(std::string_view text) {
  for (const std::string_view scheme : {"nats://", "tls://"}) {
    if (text.starts_with(scheme)) return isGraphic(text.substr(scheme.size()));
  }
  return false;
}

// Names separated by single dots. "$" begins the subjects of the server itself.
bool isSubject(std::string_view text) {
  return isGraphic(text) && text.find_first_of("*>") == std::string_view::npos &&
         text.find("..") == std::string_view::npos && !text.starts_with('.') &&
         !text.ends_with('.') && !text.starts_with('$');
}

bool isStreamName(std::string_view text) {
  return isGraphic(text) && text.size() <= kLongestStreamName &&
         text.find_first_of("*>./\\") == std::string_view::npos;
}

void readLinkTls(TableReader table, std::optional<Configuration::Link::Tls>& result) {
  if (!table.isPresent()) return;
  // Do not use emplace(), because with clang 14 it cannot construct an aggregate.
  Configuration::Link::Tls& tls = *(result = Configuration::Link::Tls{});
  table.read("ca", tls.ca, kLongestPath);
  table.read("certificate", tls.certificate, kLongestPath);
  table.read("key", tls.key, kLongestPath);
  table.read("verify", tls.verify);
  // Require the certificate and the key together, because the link would ignore a key without a
  // certificate, and the servers would then refuse the link.
  if (tls.key.empty()) table.refuse("certificate", "a path together with link.tls.key");
  if (tls.certificate.empty()) table.refuse("key", "a path together with link.tls.certificate");
  table.finish();
}

void readLink(TableReader table, Configuration::Link& link) {
  auto backend = static_cast<std::size_t>(link.backend);
  table.readChoice("backend", {"local", "nats", "none"}, backend);
  link.backend = static_cast<LinkBackend>(backend);
  table.readTexts("servers", isServerURL, "addresses such as \"nats://127.0.0.1:4222\"",
                  link.servers);
  table.readText("subject", isSubject, "names between dots, without blanks, * and >", link.subject);
  table.readText("stream", isStreamName, "a name without blanks, dots, *, >, / and \\",
                 link.stream);
  table.read("replicas", kReplicas, link.replicas);
  table.read("spool", link.spool);
  readLinkTls(table.table("tls"), link.tls);
  table.read("credentials", link.credentials, kLongestPath);
  table.finish();
}

void readLimits(TableReader table, Configuration::Limits& limits) {
  table.read("client_history_megabytes", kMegabytes, limits.clientHistoryMegabytes);
  table.read("client_sessions", kSessions, limits.clientSessions);
  table.read("message_reporter_ids", kReporterIDs, limits.messageReporterIDs);
  table.finish();
}

void readLogLevel(TableReader& table, std::string_view key, LogLevel& level) {
  auto chosen = static_cast<std::size_t>(level);
  table.readChoice(key, {"debug", "info", "default", "error"}, chosen);
  level = static_cast<LogLevel>(chosen);
}

void readLog(TableReader table, Configuration& configuration) {
  readLogLevel(table, "level", configuration.logLevel);
  readLogLevel(table, "memory_level", configuration.logMemoryLevel);
  table.finish();
}

void readDiagnostics(TableReader table, Configuration& configuration) {
  std::uint64_t keep = configuration.keepSnapshots;
  table.read("keep_snapshots", kSnapshots, keep);
  configuration.keepSnapshots = static_cast<std::uint32_t>(keep);
  table.read("trace_points", configuration.tracePoints);
  table.finish();
}

void readFeatures(TableReader table, FeatureSwitches& features) {
  for (auto& [domain, switches] : table.readTables()) features[domain] = switches.readSwitches();
}

void readDirectory(TableReader table, std::filesystem::path& directory) {
  table.read("directory", directory, kLongestPath);
  table.finish();
}

// Sets the directories that are in the storage directory unless the file names others.
void setDefaultDirectories(Configuration& configuration) {
  configuration.preferencesDirectory = configuration.storage.directory / "preferences";
  configuration.notifyDirectory = configuration.storage.directory / "notify";
  configuration.drivers.textfiles = configuration.storage.directory / "drivers";
}

void readDrivers(TableReader table, Configuration::Drivers& drivers) {
  table.read("alsa", drivers.alsa);
  table.read("alsa_root", drivers.alsaRoot, kLongestPath);
  table.read("pipewire", drivers.pipewire);
  table.read("textfiles", drivers.textfiles, kLongestPath);
  table.finish();
}

void readPrivacy(TableReader table, Configuration::Privacy& privacy) {
  table.readPatterns("drop_keys", "patterns of keys such as \"user_*\"", privacy.dropKeys);
  table.finish();
}

Result<Configuration, ConfigurationError> parse(const std::string& file, std::string_view text,
                                                const DefaultPlaces& places) {
  ConfigurationMistakes mistakes(file);
  if (const auto trouble = findTomlTrouble(text)) {
    mistakes.add({static_cast<toml::source_index>(trouble->line), 1},
                 "the file: " + trouble->description());
    return *mistakes.first();
  }
  const toml::parse_result parsed = toml::parse(text);
  if (!parsed) {
    const toml::parse_error& error = parsed.error();
    mistakes.add(error.source().begin,
                 fmt::format("the file: expected TOML, found a mistake: {}", error.description()));
    return *mistakes.first();
  }
  Configuration configuration = defaultConfiguration(places);
  TableReader root(&parsed.table(), "", mistakes);
  readListener(root.table("listener"), configuration.listener);
  readStorage(root.table("storage"), configuration.storage);
  // Set the defaults of other directories after reading [storage], which names their parent
  // directory, and before reading the tables that may replace them.
  setDefaultDirectories(configuration);
  readDirectory(root.table("preferences"), configuration.preferencesDirectory);
  readDirectory(root.table("notify"), configuration.notifyDirectory);
  readAnalytics(root.table("analytics"), configuration.analytics);
  readLink(root.table("link"), configuration.link);
  readLimits(root.table("limits"), configuration.limits);
  readLog(root.table("log"), configuration);
  readDiagnostics(root.table("diagnostics"), configuration);
  readFeatures(root.table("features"), configuration.features);
  configuration.device = root.table("device").readValues();
  readDrivers(root.table("drivers"), configuration.drivers);
  readPrivacy(root.table("privacy"), configuration.privacy);
  root.finish();
  // Check for mistakes after all tables, because the first mistake in the text may be in the table
  // that is read last.
  if (mistakes.first().has_value()) return *mistakes.first();
  return configuration;
}

}  // namespace

std::filesystem::path configurationPath() {
  if (const char* named = configurationVariable()) return named;
  const std::filesystem::path own =
      environmentPath("XDG_CONFIG_HOME").value_or(homeDirectory() / ".config") /
      "halvox/halvox.toml";
  // Use the system's file only if the user's is missing. A user's file that cannot be read is an
  // error, which the system's file would hide.
  const bool isMissing = ::access(own.c_str(), F_OK) != 0 && (errno == ENOENT || errno == ENOTDIR);
  return isMissing ? "/etc/halvox/halvox.toml" : own;
}

DefaultPlaces placesOfService() { return {defaultSocketPath(), defaultStorageDirectory()}; }

Configuration defaultConfiguration(const DefaultPlaces& places) {
  Configuration configuration;
  configuration.listener.socket = places.socket;
  configuration.listener.mode = defaultMode(configuration.listener);
  configuration.storage.directory = places.storageDirectory;
  configuration.storage.root = configuration.storage.directory / "root";
  setDefaultDirectories(configuration);
  return configuration;
}

Result<Configuration, ConfigurationError> loadConfiguration(const DefaultPlaces& places) {
  const std::filesystem::path file = configurationPath();
  const auto text = readText(file);
  if (!text) return text.error();
  if (text->has_value()) return parse(file.native(), **text, places);
  // A file that the environment names must exist. The default places may be empty.
  if (configurationVariable() != nullptr) return unreadable(file, ENOENT);
  return defaultConfiguration(places);
}

Result<std::filesystem::path, ConfigurationError> configuredSocket() {
  // Load without a default socket. If the result then has a socket, the file names it.
  auto loaded = loadConfiguration({.socket = {}, .storageDirectory = defaultStorageDirectory()});
  if (loaded) return std::move(loaded->listener.socket);
  const bool isHidden =
      loaded.error().code == ConfigurationError::kUnreadable && configurationVariable() == nullptr;
  if (isHidden) return std::filesystem::path();
  return std::move(loaded).error();
}

}  // namespace halvox::platform::linux_
