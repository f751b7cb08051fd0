#include <sys/stat.h>

#include "platform/linux/configuration/ConfigurationFixture.h"

// Tests how mistakes in a configuration are reported.

namespace halvox::platform::linux_ {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;

struct MistakeCase {
  const char* name;
  const char* text;
  const char* mistake;
};

class ConfigurationMistakesTest : public ConfigurationFixture,
                                  public ::testing::WithParamInterface<MistakeCase> {};

TEST_P(ConfigurationMistakesTest, IsReportedWithItsPlace) {
  EXPECT_EQ(mistake(GetParam().text), GetParam().mistake);
}

INSTANTIATE_TEST_SUITE_P(
    Mistakes, ConfigurationMistakesTest,
    ::testing::Values(
        MistakeCase{"WrongType", "[listener]\nsocket = 3",
                    "2:10: listener.socket: expected an absolute path, found 3"},
        MistakeCase{"NoMode", "[listener]\nmode = \"rw\"",
                    "2:8: listener.mode: expected permissions such as \"0660\", from \"0600\" to "
                    "\"0777\", found the string \"rw\""},
        MistakeCase{"ModeWithoutTheOwner", "[listener]\nmode = \"0466\"",
                    "2:8: listener.mode: expected permissions such as \"0660\", from \"0600\" to "
                    "\"0777\", found the string \"0466\""},
        MistakeCase{"NoGroup", "[listener]\ngroup = \"\"",
                    "2:9: listener.group: expected the name of a group, found the string \"\""},
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
        MistakeCase{"TooManyReporterIDs", "[limits]\nmessage_reporter_ids = 1000001",
                    "2:24: limits.message_reporter_ids: expected an integer from 1 to 1000000, "
                    "found 1000001"},
        MistakeCase{"Fraction", "[storage]\nmax_megabytes = 1.5",
                    "2:17: storage.max_megabytes: expected an integer from 1 to 1048576, found "
                    "1.5"},
        MistakeCase{"NotANumberOfSeconds", "[listener]\nmessage_seconds = nan",
                    "2:19: listener.message_seconds: expected a number of seconds from 0.001 to "
                    "86400, found nan"},
        MistakeCase{"NoSeconds", "[listener]\nhandshake_seconds = 0",
                    "2:21: listener.handshake_seconds: expected a number of seconds from 0.001 "
                    "to 86400, found 0"},
        MistakeCase{"NoPatterns", "[privacy]\ndrop_keys = []",
                    "2:13: privacy.drop_keys: expected an array of patterns of keys such as "
                    "\"user_*\", found an array"},
        MistakeCase{"PatternThatIsNoText", "[privacy]\ndrop_keys = [\"a\", 7]",
                    "2:19: privacy.drop_keys: expected an array of patterns of keys such as "
                    "\"user_*\", found 7"},
        MistakeCase{"EmptyPattern", "[privacy]\ndrop_keys = [\"a\", \"\"]",
                    "2:19: privacy.drop_keys: expected a pattern, found the string \"\": an empty "
                    "pattern matches nothing"},
        MistakeCase{"ListWithoutEnd", "[privacy]\ndrop_keys = [\"a[[:alpha:]\"]",
                    "2:14: privacy.drop_keys: expected a pattern, found the string "
                    "\"a[[:alpha:]\": character 2: the list has no \"]\" at its end"},
        MistakeCase{"RangeOfNothing", "[privacy]\ndrop_keys = [\"a[z-a]\"]",
                    "2:14: privacy.drop_keys: expected a pattern, found the string \"a[z-a]\": "
                    "character 3: the range z-a is empty, because its end is before its start"},
        MistakeCase{"MisspeltRule", "[privacy]\ndrop_key = [\"a\"]",
                    "2:1: privacy.drop_key: expected a known key, found an unknown one; the "
                    "closest is \"drop_keys\""},
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
        MistakeCase{"TracePointsWithoutAFlag", "[diagnostics]\ntrace_points = 1",
                    "2:16: diagnostics.trace_points: expected true or false, found 1"},
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

TEST_F(ConfigurationMistakesTest, SocketPathMustFitIntoAnAddress) {
  const std::string longest = "/" + std::string(106, 'x');

  EXPECT_EQ(loaded("listener.socket = \"" + longest + "\"").listener.socket, longest);
  EXPECT_THAT(mistake("listener.socket = \"" + longest + "x\""),
              HasSubstr("listener.socket: expected an absolute path of at most 107 bytes, found"));
}

// Walking through the tables that such a key makes would overflow the stack.
TEST_F(ConfigurationMistakesTest, KeyOfManyWordsIsReportedWithItsLine) {
  std::string key = "a";
  for (int count = 1; count < 100'000; ++count) key += ".a";

  for (const std::string& line : {key + " = 1\n", "[" + key + "]\n", "b = {" + key + " = 1}\n"}) {
    EXPECT_EQ(mistake("[log]\n\n" + line),
              "3:1: the file: expected at most 256 levels of tables and arrays, found more");
  }
}

TEST_F(ConfigurationMistakesTest, SyntaxErrorIsReportedWithItsPlace) {
  EXPECT_THAT(mistake("[listener]\nsocket = = 3\n"),
              StartsWith("2:10: the file: expected TOML, found a mistake: "));
}

TEST_F(ConfigurationMistakesTest, AHeaderWithoutAKeyIsAMistake) {
  for (const std::string header : {"[=]", "[\x01]", "[[,]]", "[a.=]"}) {
    EXPECT_THAT(mistake(header + "\nsocket = 3\n"),
                AllOf(StartsWith("1:"), HasSubstr("the file: expected TOML, found a mistake: ")))
        << header;
  }
}

TEST_F(ConfigurationMistakesTest, TextThatIsNotUtf8IsAMistake) {
  // The parser reports the place of the last character before the mistake.
  EXPECT_THAT(mistake("[listener]\nsocket = \"/\xFF\"\n"),
              StartsWith("2:11: the file: expected TOML, found a mistake: "));
}

TEST_F(ConfigurationMistakesTest, LargeFileIsRefused) {
  EXPECT_EQ(mistake("#" + std::string(1U << 20U, 'x')),
            "1:1: the file: expected at most 1048576 bytes, found more");
  loaded("#" + std::string((1U << 20U) - 1, 'x'));
}

TEST_F(ConfigurationMistakesTest, MistakeStaysOnOneLine) {
  const std::string text = mistake("\"a\\nb\\u001b\" = 1");

  EXPECT_THAT(text, StartsWith("1:1: a\\nb\\x1b: expected a known key"));
}

TEST_F(ConfigurationMistakesTest, NamedFileMustExist) {
  ::setenv("HALVOX_CONFIG", (directory_ / "none.toml").c_str(), 1);

  const auto result = loadConfiguration();

  ASSERT_FALSE(result);
  EXPECT_EQ(result.error().code, ConfigurationError::kUnreadable);
  EXPECT_EQ(result.error().message,
            (directory_ / "none.toml").native() +
                ": the configuration cannot be read: No such file or directory");
}

TEST_F(ConfigurationMistakesTest, DirectoryCannotBeRead) {
  ::setenv("HALVOX_CONFIG", directory_.c_str(), 1);

  const auto result = loadConfiguration();

  ASSERT_FALSE(result);
  EXPECT_EQ(result.error().code, ConfigurationError::kUnreadable);
  EXPECT_THAT(result.error().message, EndsWith("Is a directory"));
}

TEST_F(ConfigurationMistakesTest, PipeThatNobodyWritesToDoesNotHoldUpTheStart) {
  const auto pipe = directory_ / "pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  ::setenv("HALVOX_CONFIG", pipe.c_str(), 1);

  EXPECT_TRUE(loadConfiguration());
}

}  // namespace
}  // namespace halvox::platform::linux_
