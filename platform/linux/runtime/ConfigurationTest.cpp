#include "platform/linux/runtime/Configuration.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <variant>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace halvox::platform::linux_ {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr const char* kVariables[] = {"HALVOX_CONFIG",
                                      "XDG_CONFIG_HOME",
                                      "RUNTIME_DIRECTORY",
                                      "XDG_RUNTIME_DIR",
                                      "STATE_DIRECTORY",
                                      "XDG_STATE_HOME",
                                      "HOME"};

// A scratch directory as home, and no other variable set that the configuration looks at.
class ConfigurationTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string name = ::testing::TempDir() + "halvox-configuration-XXXXXX";
    ASSERT_NE(::mkdtemp(name.data()), nullptr);
    directory_ = name;
    for (const char* variable : kVariables) {
      if (const char* value = std::getenv(variable)) saved_[variable] = value;
      ::unsetenv(variable);
    }
    ::setenv("HOME", directory_.c_str(), 1);
  }
  void TearDown() override {
    for (const char* variable : kVariables) ::unsetenv(variable);
    for (const auto& [variable, value] : saved_) ::setenv(variable.c_str(), value.c_str(), 1);
    std::filesystem::remove_all(directory_);
  }

  std::filesystem::path write(std::string_view text, const std::string& name = "halvox.toml") {
    std::filesystem::path file = directory_ / name;
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary) << text;
    return file;
  }
  std::variant<Configuration, ConfigurationError> load(std::string_view text) {
    ::setenv("HALVOX_CONFIG", write(text).c_str(), 1);
    return loadConfiguration();
  }
  Configuration loaded(std::string_view text) {
    auto result = load(text);
    if (const auto* error = std::get_if<ConfigurationError>(&result)) {
      ADD_FAILURE() << error->description;
      return {};
    }
    return std::get<Configuration>(std::move(result));
  }
  // What is wrong with that text, without the file's name.
  std::string mistake(std::string_view text) {
    const auto result = load(text);
    const auto* error = std::get_if<ConfigurationError>(&result);
    if (error == nullptr) return "(none)";
    EXPECT_EQ(error->kind, ConfigurationError::Kind::kWrong);
    const std::string prefix = (directory_ / "halvox.toml").native() + ":";
    EXPECT_THAT(error->description, StartsWith(prefix));
    return error->description.substr(prefix.size());
  }

  std::filesystem::path directory_;
  std::map<std::string, std::string> saved_;
};

TEST_F(ConfigurationTest, MissingFileMeansDefaults) {
  if (std::filesystem::exists("/etc/halvox/halvox.toml")) GTEST_SKIP() << "this system has one";
  const auto result = loadConfiguration();

  ASSERT_TRUE(std::holds_alternative<Configuration>(result));
  const auto& configuration = std::get<Configuration>(result);
  EXPECT_EQ(configuration.listener.socket, "/run/halvox/reporting.sock");
  EXPECT_EQ(configuration.storage.directory, directory_ / ".local/state/halvox");
  EXPECT_EQ(configuration.storage.root, directory_ / ".local/state/halvox/root");
  EXPECT_EQ(configuration.preferencesDirectory, directory_ / ".local/state/halvox/preferences");
  EXPECT_EQ(configuration.notifyDirectory, directory_ / ".local/state/halvox/notify");
  EXPECT_EQ(configuration.logLevel, LogLevel::kDefault);
  EXPECT_EQ(configuration.logMemoryLevel, LogLevel::kInfo);
  EXPECT_EQ(configuration.keepSnapshots, 20U);
  EXPECT_EQ(configuration.analytics.wanted, std::vector<std::string>{"*"});
}

TEST_F(ConfigurationTest, LevelsOfTheLogAndOfItsMemoryAreTwoThings) {
  const Configuration written = loaded("[log]\nlevel = \"error\"");
  const Configuration kept = loaded("[log]\nmemory_level = \"debug\"");

  EXPECT_EQ(written.logMemoryLevel, LogLevel::kInfo);
  EXPECT_EQ(kept.logLevel, LogLevel::kDefault);
  EXPECT_EQ(kept.logMemoryLevel, LogLevel::kDebug);
}

TEST_F(ConfigurationTest, EnvironmentGivesTheDefaultDirectories) {
  ::setenv("XDG_RUNTIME_DIR", "/run/user/7", 1);
  ::setenv("XDG_STATE_HOME", "/var/state", 1);

  const Configuration configuration = loaded("");

  EXPECT_EQ(configuration.listener.socket, "/run/user/7/halvox/reporting.sock");
  EXPECT_EQ(configuration.storage.directory, "/var/state/halvox");
}

TEST_F(ConfigurationTest, DirectoriesOfTheServiceManagerComeFirst) {
  ::setenv("XDG_RUNTIME_DIR", "/run/user/7", 1);
  ::setenv("XDG_STATE_HOME", "/var/state", 1);
  ::setenv("RUNTIME_DIRECTORY", "/run/one:/run/two", 1);
  ::setenv("STATE_DIRECTORY", "/var/lib/halvox", 1);

  const Configuration configuration = loaded("");

  EXPECT_EQ(configuration.listener.socket, "/run/one/reporting.sock");
  EXPECT_EQ(configuration.storage.directory, "/var/lib/halvox");
}

TEST_F(ConfigurationTest, RelativeDirectoriesOfTheEnvironmentAreIgnored) {
  ::setenv("XDG_RUNTIME_DIR", "run", 1);
  ::setenv("XDG_STATE_HOME", "", 1);

  const Configuration configuration = loaded("");

  EXPECT_EQ(configuration.listener.socket, "/run/halvox/reporting.sock");
  EXPECT_EQ(configuration.storage.directory, directory_ / ".local/state/halvox");
}

TEST_F(ConfigurationTest, FileOfTheUserComesBeforeThatOfTheSystem) {
  EXPECT_EQ(configurationPath(), "/etc/halvox/halvox.toml");

  const auto own = write("", ".config/halvox/halvox.toml");
  EXPECT_EQ(configurationPath(), own);

  ::setenv("XDG_CONFIG_HOME", (directory_ / "xdg").c_str(), 1);
  const auto xdg = write("", "xdg/halvox/halvox.toml");
  EXPECT_EQ(configurationPath(), xdg);

  ::setenv("HALVOX_CONFIG", "/elsewhere", 1);
  EXPECT_EQ(configurationPath(), "/elsewhere");
}

TEST_F(ConfigurationTest, EveryKeyIsTaken) {
  const Configuration configuration = loaded(R"(
[listener]
socket = "/tmp/r.sock"
bus = "system"
handshake_seconds = 2.5
message_seconds = 9
[storage]
directory = "~/state"
root = "/srv/root"
retention_days = 7
max_megabytes = 100
[analytics]
wanted = ["a*", "b"]
sink = "sqlite"
[limits]
client_history_megabytes = 12
client_sessions = 34
[log]
level = "debug"
memory_level = "error"
[diagnostics]
keep_snapshots = 3
)");

  EXPECT_EQ(configuration.listener.socket, "/tmp/r.sock");
  EXPECT_EQ(configuration.listener.bus, BusKind::kSystem);
  EXPECT_EQ(configuration.listener.handshakeTimeout, std::chrono::milliseconds(2500));
  EXPECT_EQ(configuration.listener.messageTimeout, std::chrono::seconds(9));
  EXPECT_EQ(configuration.storage.directory, directory_ / "state");
  EXPECT_EQ(configuration.storage.root, "/srv/root");
  EXPECT_EQ(configuration.storage.retentionDays, 7U);
  EXPECT_EQ(configuration.storage.maxMegabytes, 100U);
  EXPECT_EQ(configuration.analytics.wanted, (std::vector<std::string>{"a*", "b"}));
  EXPECT_EQ(configuration.limits.clientHistoryMegabytes, 12U);
  EXPECT_EQ(configuration.limits.clientSessions, 34U);
  EXPECT_EQ(configuration.logLevel, LogLevel::kDebug);
  EXPECT_EQ(configuration.logMemoryLevel, LogLevel::kError);
  EXPECT_EQ(configuration.keepSnapshots, 3U);
}

TEST_F(ConfigurationTest, RootFollowsTheDirectory) {
  EXPECT_EQ(loaded("storage.directory = \"/srv\"").storage.root, "/srv/root");
}

TEST_F(ConfigurationTest, DevicePropertiesMayHaveAnyType) {
  const Configuration configuration = loaded(R"(
[device]
InternalBuild = true
Model = "D1"
Ports = [1, 2.5, {name = "x"}]
Made = 1970-01-02T01:00:00.5+01:00
)");

  const Value ports(Array{1, 2.5, Dictionary{{"name", "x"}}});
  EXPECT_EQ(*configuration.device.find("InternalBuild"), Value(true));
  EXPECT_EQ(*configuration.device.find("Model"), Value("D1"));
  EXPECT_EQ(*configuration.device.find("Ports"), ports);
  EXPECT_EQ(*configuration.device.find("Made"), Value(Date{86'400.5}));
}

TEST_F(ConfigurationTest, FeaturesAreReadByDomain) {
  const Configuration configuration =
      loaded("[features.Acoustat]\nTracing = true\nSilence = false\n[features.Other]\n");

  const FeatureSwitches expected{{"Acoustat", {{"Silence", false}, {"Tracing", true}}},
                                 {"Other", {}}};
  EXPECT_EQ(configuration.features, expected);
}

TEST_F(ConfigurationTest, LinkIsLocalByDefault) {
  const Configuration::Link link = loaded("").link;

  EXPECT_EQ(link.backend, LinkBackend::kLocal);
  EXPECT_EQ(link.servers, std::vector<std::string>{"nats://127.0.0.1:4222"});
  EXPECT_EQ(link.subject, "halvox");
  EXPECT_EQ(link.stream, "HALVOX");
  EXPECT_FALSE(link.tls.has_value());
  EXPECT_TRUE(link.credentials.empty());
}

TEST_F(ConfigurationTest, EveryKeyOfTheLinkIsTaken) {
  const Configuration::Link link = loaded(R"(
[link]
backend = "nats"
servers = ["nats://a:1", "tls://user:word@b:2"]
subject = "fleet.audio"
stream = "AUDIO"
credentials = "~/halvox.creds"
[link.tls]
ca = "/etc/ca.pem"
certificate = "/etc/own.pem"
key = "/etc/own.key"
verify = false
)")
                                       .link;

  EXPECT_EQ(link.backend, LinkBackend::kNats);
  EXPECT_EQ(link.servers, (std::vector<std::string>{"nats://a:1", "tls://user:word@b:2"}));
  EXPECT_EQ(link.subject, "fleet.audio");
  EXPECT_EQ(link.stream, "AUDIO");
  EXPECT_EQ(link.credentials, directory_ / "halvox.creds");
  ASSERT_TRUE(link.tls.has_value());
  EXPECT_EQ(link.tls->ca, "/etc/ca.pem");
  EXPECT_EQ(link.tls->certificate, "/etc/own.pem");
  EXPECT_EQ(link.tls->key, "/etc/own.key");
  EXPECT_FALSE(link.tls->verify);
}

TEST_F(ConfigurationTest, EmptyTlsTableMeansTlsWithTheSystemsAuthorities) {
  const Configuration::Link link = loaded("[link.tls]").link;

  ASSERT_TRUE(link.tls.has_value());
  EXPECT_TRUE(link.tls->ca.empty());
  EXPECT_TRUE(link.tls->verify);
}

TEST_F(ConfigurationTest, SettingsThatFollowAreBelowTheStorageDirectoryUnlessPutElsewhere) {
  const Configuration usual = loaded("[storage]\ndirectory = \"/s\"");
  EXPECT_EQ(usual.preferencesDirectory, "/s/preferences");
  EXPECT_EQ(usual.notifyDirectory, "/s/notify");

  const Configuration moved =
      loaded("[preferences]\ndirectory = \"/p\"\n[notify]\ndirectory = \"/n\"");
  EXPECT_EQ(moved.preferencesDirectory, "/p");
  EXPECT_EQ(moved.notifyDirectory, "/n");
}

TEST_F(ConfigurationTest, KeysOfOtherPiecesAreKnown) {
  loaded(R"(
[drivers]
alsa = true
alsa_root = "/"
pipewire = false
textfiles = "/t"
)");
}

struct MistakeCase {
  const char* name;
  const char* text;
  const char* mistake;
};

class ConfigurationMistakeTest : public ConfigurationTest,
                                 public ::testing::WithParamInterface<MistakeCase> {};

TEST_P(ConfigurationMistakeTest, IsToldWithItsPlace) {
  EXPECT_EQ(mistake(GetParam().text), GetParam().mistake);
}

INSTANTIATE_TEST_SUITE_P(
    Mistakes, ConfigurationMistakeTest,
    ::testing::Values(
        MistakeCase{"WrongType", "[listener]\nsocket = 3",
                    "2:10: listener.socket: expected an absolute path, found 3"},
        MistakeCase{"RelativePath", "[storage]\ndirectory = \"state\"",
                    "2:13: storage.directory: expected an absolute path, found the string "
                    "\"state\""},
        MistakeCase{"OtherUsersHome", "[storage]\nroot = \"~root/x\"",
                    "2:8: storage.root: expected an absolute path, found the string \"~root/x\""},
        MistakeCase{"PathWithNul", "[storage]\nroot = \"/a\\u0000b\"",
                    "2:8: storage.root: expected an absolute path, found the string "
                    "\"/a\\x00b\""},
        MistakeCase{"Zero", "[storage]\nretention_days = 0",
                    "2:18: storage.retention_days: expected an integer from 1 to 36500, found 0"},
        MistakeCase{"Negative", "[limits]\nclient_sessions = -5",
                    "2:19: limits.client_sessions: expected an integer from 1 to 1000000000, "
                    "found -5"},
        MistakeCase{"Fraction", "[storage]\nmax_megabytes = 1.5",
                    "2:17: storage.max_megabytes: expected an integer from 1 to 1048576, found "
                    "1.5"},
        MistakeCase{"NotANumberOfSeconds", "[listener]\nmessage_seconds = nan",
                    "2:19: listener.message_seconds: expected a number of seconds from 0.001 to "
                    "86400, found nan"},
        MistakeCase{"NoSeconds", "[listener]\nhandshake_seconds = 0",
                    "2:21: listener.handshake_seconds: expected a number of seconds from 0.001 "
                    "to 86400, found 0"},
        MistakeCase{"UnknownChoice", "[log]\nlevel = \"verbose\"",
                    "2:9: log.level: expected \"debug\" or \"info\" or \"default\" or \"error\", "
                    "found the string \"verbose\""},
        MistakeCase{"UnknownMemoryLevel", "[log]\nmemory_level = 1",
                    "2:16: log.memory_level: expected \"debug\" or \"info\" or \"default\" or "
                    "\"error\", found 1"},
        MistakeCase{"NoSnapshots", "[diagnostics]\nkeep_snapshots = 0",
                    "2:18: diagnostics.keep_snapshots: expected an integer from 1 to 10000, found "
                    "0"},
        MistakeCase{"TooManySnapshots", "[diagnostics]\nkeep_snapshots = 10001",
                    "2:18: diagnostics.keep_snapshots: expected an integer from 1 to 10000, found "
                    "10001"},
        MistakeCase{"SinkThatThisProgramLacks", "[analytics]\nsink = \"nats\"",
                    "2:8: analytics.sink: expected \"sqlite\", found the string \"nats\""},
        MistakeCase{"ElementType", "[analytics]\nwanted = [\"a\", 1]",
                    "2:16: analytics.wanted: expected an array of strings, found 1"},
        MistakeCase{"TableAsValue", "listener = 1", "1:12: listener: expected a table, found 1"},
        MistakeCase{"FeatureAsValue", "[features]\nTracing = true",
                    "2:11: features.Tracing: expected a table, found true"},
        MistakeCase{"SwitchType", "[features.A]\nB = \"on\"",
                    "2:5: features.A.B: expected true or false, found the string \"on\""},
        MistakeCase{"TypeOfAnotherPiecesKey", "[drivers]\nalsa = 1",
                    "2:8: drivers.alsa: expected true or false, found 1"},
        MistakeCase{"LinkBackend", "[link]\nbackend = \"remote\"",
                    "2:11: link.backend: expected \"local\" or \"nats\" or \"none\", found the "
                    "string \"remote\""},
        MistakeCase{"NoServers", "[link]\nservers = []",
                    "2:11: link.servers: expected an array of addresses such as "
                    "\"nats://127.0.0.1:4222\", found an array"},
        MistakeCase{"ServerWithoutScheme", "[link]\nservers = [\"nats://a\", \"b:4222\"]",
                    "2:24: link.servers: expected an array of addresses such as "
                    "\"nats://127.0.0.1:4222\", found the string \"b:4222\""},
        MistakeCase{"WildSubject", "[link]\nsubject = \"halvox.>\"",
                    "2:11: link.subject: expected names between dots, without blanks, * and >, "
                    "found the string \"halvox.>\""},
        MistakeCase{"StreamName", "[link]\nstream = \"../up\"",
                    "2:10: link.stream: expected a name without blanks, dots, *, >, / and \\, "
                    "found the string \"../up\""},
        MistakeCase{"TlsAsSwitch", "[link]\ntls = true",
                    "2:7: link.tls: expected a table, found true"},
        MistakeCase{"TlsVerify", "[link.tls]\nverify = \"no\"",
                    "2:10: link.tls.verify: expected true or false, found the string \"no\""},
        MistakeCase{"CertificateWithoutKey", "[link.tls]\ncertificate = \"/a\"",
                    "2:15: link.tls.certificate: expected a path together with link.tls.key, "
                    "found the string \"/a\""},
        MistakeCase{"KeyWithoutCertificate", "[link.tls]\nkey = \"/a\"",
                    "2:7: link.tls.key: expected a path together with link.tls.certificate, "
                    "found the string \"/a\""},
        MistakeCase{"UnknownTlsKey", "[link.tls]\ncertificates = \"/a\"",
                    "2:1: link.tls.certificates: expected a known key, found an unknown one; the "
                    "closest is \"certificate\""},
        MistakeCase{"RelativeCredentials", "[link]\ncredentials = \"creds\"",
                    "2:15: link.credentials: expected an absolute path, found the string "
                    "\"creds\""},
        MistakeCase{"LocalTime", "[device]\nMade = 2024-01-01",
                    "2:8: device.Made: expected a string, a number, a switch, a table, an array "
                    "or a time with its offset, found a date or time"},
        MistakeCase{"UnknownKey", "[listener]\nsokcet = \"/x\"",
                    "2:1: listener.sokcet: expected a known key, found an unknown one; the "
                    "closest is \"socket\""},
        MistakeCase{"UnknownTable", "[storge]\n",
                    "1:2: storge: expected a known key, found an unknown one; the closest is "
                    "\"storage\""},
        MistakeCase{"FirstOfSeveral", "[storage]\nretention_days = 0\n[listener]\nbus = 1\n",
                    "2:18: storage.retention_days: expected an integer from 1 to 36500, found "
                    "0"}),
    [](const auto& test) { return std::string(test.param.name); });

TEST_F(ConfigurationTest, SocketPathMustFitIntoAnAddress) {
  const std::string longest = "/" + std::string(106, 'x');

  EXPECT_EQ(loaded("listener.socket = \"" + longest + "\"").listener.socket, longest);
  EXPECT_THAT(mistake("listener.socket = \"" + longest + "x\""),
              HasSubstr("listener.socket: expected an absolute path of at most 107 bytes, found"));
}

// Walking through as many tables as such a key makes would end the process.
TEST_F(ConfigurationTest, KeyOfManyWordsIsToldWithItsLine) {
  std::string key = "a";
  for (int count = 1; count < 100'000; ++count) key += ".a";

  for (const std::string& line : {key + " = 1\n", "[" + key + "]\n", "b = {" + key + " = 1}\n"}) {
    EXPECT_EQ(mistake("[log]\n\n" + line),
              "3:1: the file: expected at most 256 levels of tables and arrays, found more");
  }
}

TEST_F(ConfigurationTest, SyntaxErrorIsToldWithItsPlace) {
  EXPECT_THAT(mistake("[listener]\nsocket = = 3\n"),
              StartsWith("2:10: the file: expected TOML, found a mistake: "));
}

TEST_F(ConfigurationTest, TextThatIsNotUtf8IsAMistake) {
  // The place is that of the last character before it.
  EXPECT_THAT(mistake("[listener]\nsocket = \"/\xFF\"\n"),
              StartsWith("2:11: the file: expected TOML, found a mistake: "));
}

TEST_F(ConfigurationTest, LargeFileIsRefused) {
  EXPECT_EQ(mistake("#" + std::string(1U << 20U, 'x')),
            "1:1: the file: expected at most 1048576 bytes, found more");
  loaded("#" + std::string((1U << 20U) - 1, 'x'));
}

TEST_F(ConfigurationTest, MistakeStaysOnOneLine) {
  const std::string text = mistake("\"a\\nb\\u001b\" = 1");

  EXPECT_THAT(text, StartsWith("1:1: a\\nb\\x1b: expected a known key"));
}

TEST_F(ConfigurationTest, NamedFileMustExist) {
  ::setenv("HALVOX_CONFIG", (directory_ / "none.toml").c_str(), 1);

  const auto result = loadConfiguration();

  const auto* error = std::get_if<ConfigurationError>(&result);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->kind, ConfigurationError::Kind::kUnreadable);
  EXPECT_EQ(error->description,
            (directory_ / "none.toml").native() +
                ": the configuration cannot be read: No such file or directory");
}

TEST_F(ConfigurationTest, DirectoryCannotBeRead) {
  ::setenv("HALVOX_CONFIG", directory_.c_str(), 1);

  const auto result = loadConfiguration();

  const auto* error = std::get_if<ConfigurationError>(&result);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->kind, ConfigurationError::Kind::kUnreadable);
  EXPECT_THAT(error->description, EndsWith("Is a directory"));
}

TEST_F(ConfigurationTest, PipeThatNobodyWritesToDoesNotHoldUpTheStart) {
  const auto pipe = directory_ / "pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  ::setenv("HALVOX_CONFIG", pipe.c_str(), 1);

  EXPECT_TRUE(std::holds_alternative<Configuration>(loadConfiguration()));
}

}  // namespace
}  // namespace halvox::platform::linux_
