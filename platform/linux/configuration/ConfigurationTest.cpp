#include "platform/linux/configuration/Configuration.h"

#include "platform/linux/configuration/ConfigurationFixture.h"

namespace halvox::platform::linux_ {
namespace {

class ConfigurationTest : public ConfigurationFixture {};

TEST_F(ConfigurationTest, MissingFileMeansDefaults) {
  if (std::filesystem::exists("/etc/halvox/halvox.toml")) GTEST_SKIP() << "this system has one";
  const auto result = loadConfiguration();

  ASSERT_TRUE(result);
  const Configuration& configuration = *result;
  EXPECT_EQ(configuration.listener.socket, "/run/halvox/reporting.sock");
  EXPECT_EQ(configuration.storage.directory, directory_ / ".local/state/halvox");
  EXPECT_EQ(configuration.storage.root, directory_ / ".local/state/halvox/root");
  EXPECT_EQ(configuration.preferencesDirectory, directory_ / ".local/state/halvox/preferences");
  EXPECT_EQ(configuration.notifyDirectory, directory_ / ".local/state/halvox/notify");
  EXPECT_EQ(configuration.logLevel, LogLevel::kDefault);
  EXPECT_EQ(configuration.logMemoryLevel, LogLevel::kInfo);
  EXPECT_EQ(configuration.keepSnapshots, 20U);
  EXPECT_FALSE(configuration.tracePoints);
  EXPECT_EQ(configuration.analytics.wanted, std::vector<std::string>{"*"});
}

TEST_F(ConfigurationTest, LevelsOfTheLogAndOfItsMemoryAreIndependent) {
  const Configuration written = loaded("[log]\nlevel = \"error\"");
  const Configuration kept = loaded("[log]\nmemory_level = \"debug\"");

  EXPECT_EQ(written.logMemoryLevel, LogLevel::kInfo);
  EXPECT_EQ(kept.logLevel, LogLevel::kDefault);
  EXPECT_EQ(kept.logMemoryLevel, LogLevel::kDebug);
}

TEST_F(ConfigurationTest, PatternsOfDroppedKeysMayHaveListsOfCharacters) {
  const Configuration configuration =
      loaded("[privacy]\ndrop_keys = ['user_*', 'a[]x]', 'b[!]]', 'c[[]', '[a-z]?']");

  EXPECT_EQ(configuration.privacy.dropKeys,
            (std::vector<std::string>{"user_*", "a[]x]", "b[!]]", "c[[]", "[a-z]?"}));
  EXPECT_TRUE(loaded("").privacy.dropKeys.empty());
  EXPECT_TRUE(loaded("[privacy]").privacy.dropKeys.empty());
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

TEST_F(ConfigurationTest, ProgramsMayHaveOtherPlacesByDefault) {
  ::setenv("HALVOX_CONFIG", write("").c_str(), 1);

  const auto configuration = *loadConfiguration({.socket = {}, .storageDirectory = "/there"});

  EXPECT_EQ(configuration.listener.socket, "");
  EXPECT_EQ(configuration.storage.directory, "/there");
  EXPECT_EQ(configuration.notifyDirectory, "/there/notify");
}

TEST_F(ConfigurationTest, ProgramsGetTheSocketOnlyWhenTheFileNamesIt) {
  ::setenv("XDG_RUNTIME_DIR", "/run/user/7", 1);
  ::setenv("HALVOX_CONFIG", write("").c_str(), 1);
  EXPECT_EQ(*configuredSocket(), "");

  ::setenv("HALVOX_CONFIG", write("[listener]\nsocket = \"/named\"").c_str(), 1);
  EXPECT_EQ(*configuredSocket(), "/named");

  ::setenv("HALVOX_CONFIG", write("[listener]\nsocket = 7").c_str(), 1);
  EXPECT_FALSE(configuredSocket());
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
mode = "0640"
group = "audio"
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
message_reporter_ids = 56
[log]
level = "debug"
memory_level = "error"
[diagnostics]
keep_snapshots = 3
trace_points = true
)");

  EXPECT_EQ(configuration.listener.socket, "/tmp/r.sock");
  EXPECT_EQ(configuration.listener.mode, 0640U);
  EXPECT_EQ(configuration.listener.group, "audio");
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
  EXPECT_EQ(configuration.limits.messageReporterIDs, 56U);
  EXPECT_EQ(configuration.logLevel, LogLevel::kDebug);
  EXPECT_EQ(configuration.logMemoryLevel, LogLevel::kError);
  EXPECT_EQ(configuration.keepSnapshots, 3U);
  EXPECT_TRUE(configuration.tracePoints);
}

TEST_F(ConfigurationTest, EveryUserMayConnectToAServiceOfTheSystem) {
  EXPECT_EQ(loaded("").listener.mode, 0666U);
  ::setenv("XDG_RUNTIME_DIR", "/run/user/0", 1);
  EXPECT_EQ(loaded("[listener]\nsocket = \"/run/halvox/r.sock\"\n").listener.mode, 0666U);
  EXPECT_EQ(loaded("[listener]\nsocket = \"/run/user/01/r.sock\"\n").listener.mode, 0666U);
}

TEST_F(ConfigurationTest, OnlyTheUserMayConnectToASocketOfALogin) {
  ::setenv("XDG_RUNTIME_DIR", "/run/user/1000", 1);

  EXPECT_EQ(loaded("").listener.mode, 0600U);
  EXPECT_EQ(defaultConfiguration().listener.mode, 0600U);
  ::setenv("RUNTIME_DIRECTORY", "/run/user/1000/halvox",
           1);  // as the user's service manager has it
  EXPECT_EQ(loaded("").listener.mode, 0600U);
}

TEST_F(ConfigurationTest, AGroupThatIsGivenKeepsOthersOutUnlessTheModeSaysOtherwise) {
  EXPECT_EQ(loaded("[listener]\ngroup = \"audio\"\n").listener.mode, 0660U);
  EXPECT_EQ(loaded("[listener]\ngroup = \"audio\"\nmode = \"0664\"\n").listener.mode, 0664U);
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
  EXPECT_TRUE(link.spool);
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
spool = false
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
  EXPECT_FALSE(link.spool);
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

}  // namespace
}  // namespace halvox::platform::linux_
