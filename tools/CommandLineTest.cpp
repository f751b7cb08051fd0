#include "tools/CommandLine.h"

#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using namespace std::chrono_literals;
using Words = std::vector<std::string>;

std::variant<Command, CommandLineText> parse(const Words& words, const std::string& input = "",
                                             CommandSource source = CommandSource::kArguments) {
  std::istringstream stream(input);
  return parseCommandLine(words, source, stream);
}

template <typename T>
T requestOf(const std::variant<Command, CommandLineText>& parsed) {
  const auto* command = std::get_if<Command>(&parsed);
  if (command == nullptr) {
    ADD_FAILURE() << std::get<CommandLineText>(parsed).text;
    return {};
  }
  return std::get<T>(std::get<Request>(command->what));
}

std::string errorOf(const Words& words) {
  const auto parsed = parse(words);
  const auto* text = std::get_if<CommandLineText>(&parsed);
  if (text == nullptr || text->status != ExitStatus::kBadArguments) return "";
  return text->text.substr(0, text->text.find('\n'));
}

TEST(CommandLineTest, SessionRequestsTakeAnID) {
  EXPECT_EQ(requestOf<Create>(parse({"create", "7"})).id, 7);
  EXPECT_EQ(requestOf<Stop>(parse({"stop", "-7"})).id, -7);
  EXPECT_EQ(requestOf<Destroy>(parse({"destroy", "0x10"})).id, 16);
  EXPECT_EQ(requestOf<GetType>(parse({"type", "7"})).id, 7);
  EXPECT_EQ(requestOf<Valid>(parse({"valid", "7"})).id, 7);
  EXPECT_EQ(requestOf<SetType>(parse({"set-type", "7", "haptics"})).type, 3);
}

TEST(CommandLineTest, AStartMayWait) {
  EXPECT_EQ(requestOf<Start>(parse({"start", "7"})).wait, std::nullopt);
  EXPECT_EQ(requestOf<Start>(parse({"start", "7", "--wait"})).wait, 5s);
  EXPECT_EQ(requestOf<Start>(parse({"start", "7", "--wait", "--timeout", "2"})).wait, 2s);
  EXPECT_EQ(requestOf<Start>(parse({"start", "7", "--wait", "0.5"})).wait, 500ms);
}

TEST(CommandLineTest, SendTakesRecipientsCategoryTypeAndMessage) {
  const auto send = requestOf<Send>(parse({"send", "--id", "7", "--id", "-8", "--category",
                                           "Session_Playback", "--type", "Start", R"({"a": 1})"}));

  EXPECT_EQ(send.ids, (std::vector<ReporterID>{7, -8}));
  EXPECT_EQ(send.category, 0x08000004U);
  EXPECT_EQ(send.type, 1);
  EXPECT_EQ(send.message, (Dictionary{{"a", 1}}));
}

// Commands are named "stop" and "start" too.
TEST(CommandLineTest, ValuesThatAreNamedLikeCommandsAreValues) {
  const auto send =
      requestOf<Send>(parse({"send", "--all", "--category", "error", "--type", "stop", "{}"}));

  EXPECT_EQ(send.type, 2);
  EXPECT_EQ(send.ids, std::nullopt);
}

TEST(CommandLineTest, SendNeedsEitherIDsOrAll) {
  EXPECT_EQ(errorOf({"send", "--category", "1", "--type", "1", "{}"}),
            "halvoxctl send: --id: is missing; expected --id ID for some sessions or --all for the "
            "active");
  EXPECT_EQ(errorOf({"send", "--all", "--id", "7", "--category", "1", "--type", "1", "{}"}),
            "halvoxctl send: --id: goes with no --all; expected one of the two");
}

TEST(CommandLineTest, ADashReadsTheDictionaryFromTheInput) {
  const auto configure = requestOf<Configure>(parse({"configure", "7", "-"}, R"({"a": 1})"));

  EXPECT_EQ(configure.configuration, (Dictionary{{"a", 1}}));
}

TEST(CommandLineTest, CommonOptionsStandBeforeOrBehindTheCommand) {
  for (const Words& words : {Words{"--json", "--socket", "/s", "--timeout", "2", "list"},
                             Words{"list", "--json", "--socket", "/s", "--timeout", "2"}}) {
    const auto parsed = parse(words);
    ASSERT_TRUE(std::holds_alternative<Command>(parsed));
    const auto& options = std::get<Command>(parsed).options;
    EXPECT_TRUE(options.json);
    EXPECT_EQ(options.socket, "/s");
    EXPECT_EQ(options.timeout, 2s);
  }
}

TEST(CommandLineTest, EventsTakeFilters) {
  const auto parsed = parse({"events", "--name", "a.*", "--name", "b", "--since", "10", "--until",
                             "1970-01-01T00:00:20Z", "--last", "3", "--follow", "--database", "d"});

  ASSERT_TRUE(std::holds_alternative<Command>(parsed));
  const auto& events = std::get<ShowEvents>(std::get<Command>(parsed).what);
  EXPECT_EQ(events.names, (std::vector<std::string>{"a.*", "b"}));
  EXPECT_EQ(events.since, 10.0);
  EXPECT_EQ(events.until, 20.0);
  EXPECT_EQ(events.last, 3U);
  EXPECT_TRUE(events.follow);
  EXPECT_EQ(events.database, "d");
}

// What a command other than a request comes to.
template <typename T>
T runOf(const Words& words) {
  const auto parsed = parse(words);
  const auto* command = std::get_if<Command>(&parsed);
  if (command == nullptr) {
    ADD_FAILURE() << std::get<CommandLineText>(parsed).text;
    return {};
  }
  return std::get<T>(command->what);
}

TEST(CommandLineTest, MetricsAreChosenByNumberAndTime) {
  const auto metrics =
      runOf<ShowRecords>({"metrics", "--id", "0x5B0003", "--id", "7", "--last", "5"});

  EXPECT_EQ(metrics.kind, ShowRecords::Kind::kMetrics);
  EXPECT_EQ(metrics.ids, (std::vector<std::int64_t>{0x5B0003, 7}));
  EXPECT_EQ(metrics.selection.last, 5U);
  EXPECT_NE(errorOf({"metrics", "--name", "a"}), "");
}

TEST(CommandLineTest, PowerEventsAreChosenByNameAndCategory) {
  const auto power = runOf<ShowRecords>(
      {"power", "--name", "Oxbow*", "--category", "28", "--since", "10", "--follow"});

  EXPECT_EQ(power.kind, ShowRecords::Kind::kPower);
  EXPECT_EQ(power.selection.names, std::vector<std::string>{"Oxbow*"});
  EXPECT_EQ(power.categories, std::vector<std::int64_t>{28});
  EXPECT_EQ(power.selection.since, 10.0);
  EXPECT_TRUE(power.selection.follow);
}

TEST(CommandLineTest, LinkMessagesAreChosenBySessionServiceCategoryAndType) {
  const auto link = runOf<ShowRecords>({"link", "--session", "-1", "--service", "music",
                                        "--category", "3", "--type", "9", "--database", "d"});

  EXPECT_EQ(link.kind, ShowRecords::Kind::kLink);
  EXPECT_EQ(link.ids, std::vector<std::int64_t>{-1});
  EXPECT_EQ(link.selection.names, std::vector<std::string>{"music"});
  EXPECT_EQ(link.categories, std::vector<std::int64_t>{3});
  EXPECT_EQ(link.types, std::vector<std::int64_t>{9});
  EXPECT_EQ(link.selection.database, "d");
  EXPECT_EQ(errorOf({"link", "--type", "x"}),
            "halvoxctl link: --type: \"x\" is no number; expected a whole number");
}

TEST(CommandLineTest, SnapshotsOfThemselvesAreListed) {
  const auto all = runOf<ShowRecords>({"snapshots"});
  const auto last = runOf<ShowRecords>({"snapshots", "--last", "5", "--follow"});

  EXPECT_EQ(all.kind, ShowRecords::Kind::kSnapshots);
  EXPECT_EQ(all.selection.last, std::nullopt);
  EXPECT_EQ(last.kind, ShowRecords::Kind::kSnapshots);
  EXPECT_EQ(last.selection.last, 5U);
  EXPECT_TRUE(last.selection.follow);
}

TEST(CommandLineTest, ASnapshotIsShownOrExtracted) {
  const auto extract =
      runOf<ExtractSnapshot>({"snapshots", "extract", "newest", "--to", "/d", "--force"});

  EXPECT_EQ(runOf<ShowSnapshot>({"snapshots", "show", "newest"}).file, "newest");
  EXPECT_EQ(extract.file, "newest");
  EXPECT_EQ(extract.directory, "/d");
  EXPECT_TRUE(extract.force);
  EXPECT_EQ(errorOf({"snapshots", "show"}), "halvoxctl snapshots show: FILE is required");
  EXPECT_NE(errorOf({"snapshots", "throw", "newest"}), "");
}

TEST(CommandLineTest, ErrorsNameTheCommandAndTheArgument) {
  EXPECT_EQ(errorOf({"create", "x"}),
            "halvoxctl create: ID: \"x\" is no reporter ID; expected a whole number of 64 bits, "
            "such as 7");
  EXPECT_EQ(errorOf({"create"}), "halvoxctl create: ID is required");
  EXPECT_EQ(errorOf({"list", "--timeout", "0"}),
            "halvoxctl list: --timeout: \"0\" is no time; expected seconds, more than 0, such as "
            "0.5 or 10");
  EXPECT_EQ(errorOf({"configure", "7", "{"}).substr(0, 34), "halvoxctl configure: JSON: no JSON");
}

TEST(CommandLineTest, AnUnknownCommandIsAnsweredWithTheKnownOnes) {
  const std::string error = errorOf({"craete", "7"});

  EXPECT_EQ(error.substr(0, 46), "halvoxctl: there is no command \"craete\"; expec");
  EXPECT_NE(error.find("set-type"), std::string::npos);
  EXPECT_NE(error.find("events"), std::string::npos);
}

TEST(CommandLineTest, ArgumentsTooManyAreRefused) {
  EXPECT_NE(errorOf({"create", "7", "8"}), "");
  EXPECT_NE(errorOf({"list", "--nonsense"}), "");
  EXPECT_NE(errorOf({}), "");
}

TEST(CommandLineTest, EveryCommandHasHelpWithAnExample) {
  for (const char* command :
       {"create",  "set-type", "type",        "configure", "start", "send",
        "stop",    "destroy",  "valid",       "list",      "kill",  "run",
        "shell",   "events",   "metrics",     "power",     "link",  "snapshots",
        "summary", "drivers",  "preferences", "notify"}) {
    const auto parsed = parse({command, "--help"});
    ASSERT_TRUE(std::holds_alternative<CommandLineText>(parsed)) << command;
    const auto& text = std::get<CommandLineText>(parsed);
    EXPECT_EQ(text.status, ExitStatus::kDone) << command;
    EXPECT_NE(text.text.find("Example:\n"), std::string::npos) << command;
  }
}

TEST(CommandLineTest, HelpOnCreateTellsHowLongASessionLives) {
  const auto parsed = parse({"create", "--help"});

  EXPECT_NE(std::get<CommandLineText>(parsed).text.find("lives as long as the connection"),
            std::string::npos);
}

TEST(CommandLineTest, TellsItsVersion) {
  const auto parsed = parse({"--version"});

  EXPECT_EQ(std::get<CommandLineText>(parsed).text.substr(0, 10), "halvoxctl ");
}

TEST(CommandLineTest, ScriptLinesHaveTheirOwnCommandsAndNotAll) {
  const auto source = CommandSource::kScriptLine;

  EXPECT_EQ(requestOf<WaitForStart>(parse({"wait", "7", "2"}, "", source)).timeout, 2s);
  EXPECT_EQ(requestOf<Sleep>(parse({"sleep", "0.25"}, "", source)).time, 250ms);
  for (const Words& words : {Words{"run", "x"}, Words{"events"}, Words{"list", "--socket", "/s"},
                             Words{"configure", "7", "-"}}) {
    EXPECT_TRUE(std::holds_alternative<CommandLineText>(parse(words, "{}", source)));
  }
}

}  // namespace
}  // namespace halvox::tools
