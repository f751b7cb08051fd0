#include "tools/CommandLine.h"

#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tools/Drivers.h"
#include "tools/Events.h"
#include "tools/Explain.h"
#include "tools/Export.h"
#include "tools/Fields.h"
#include "tools/Notify.h"
#include "tools/Preferences.h"
#include "tools/Records.h"
#include "tools/Requests.h"
#include "tools/Script.h"
#include "tools/SnapshotFiles.h"
#include "tools/Sql.h"
#include "tools/Summary.h"
#include "tools/Traces.h"

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
  return std::get<T>(*command->asked<Request>());
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
            "halvoxctl send: --id: is missing; expected --id ID for some sessions or --all for all "
            "active ones");
  EXPECT_EQ(errorOf({"send", "--all", "--id", "7", "--category", "1", "--type", "1", "{}"}),
            "halvoxctl send: --id: cannot be combined with --all; expected one of the two");
}

TEST(CommandLineTest, ADashReadsTheDictionaryFromTheInput) {
  const auto configure = requestOf<Configure>(parse({"configure", "7", "-"}, R"({"a": 1})"));

  EXPECT_EQ(configure.configuration, (Dictionary{{"a", 1}}));
}

TEST(CommandLineTest, CommonOptionsMayComeBeforeOrAfterTheCommand) {
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
  const auto& events = std::get<Command>(parsed).asked<ShowEvents>()->selection;
  EXPECT_EQ(events.names, (std::vector<std::string>{"a.*", "b"}));
  EXPECT_EQ(events.since, 10.0);
  EXPECT_EQ(events.until, 20.0);
  EXPECT_EQ(events.last, 3U);
  EXPECT_TRUE(events.follow);
  EXPECT_EQ(events.database, "d");
}

TEST(CommandLineTest, EventsAreChosenByApplicationCategoryTypeAndPattern) {
  const auto parsed = parse({"events", "--app", "a*", "--category", "session_playback", "--type",
                             "Start", "--grep", "x|y", "-n", "4"});

  ASSERT_TRUE(std::holds_alternative<Command>(parsed));
  const auto& events = *std::get<Command>(parsed).asked<ShowEvents>();
  EXPECT_EQ(events.applications, std::vector<std::string>{"a*"});
  EXPECT_EQ(events.categories, std::vector<std::uint32_t>{0x08000004});
  EXPECT_EQ(events.types, std::vector<std::uint16_t>{1});
  EXPECT_TRUE(events.selection.grep.has_value());
  EXPECT_EQ(events.selection.last, 4U);
}

TEST(CommandLineTest, EveryCommandForRowsTakesOrderCursorAndForm) {
  for (const std::string command : {"metrics", "power", "link", "snapshots"}) {
    const auto parsed =
        parse({command, "-r", "--utc", "-l", "--no-pager", "--cursor", command + ":7@5.5"});
    ASSERT_TRUE(std::holds_alternative<Command>(parsed)) << command;
    const auto& rows = std::get<Command>(parsed).asked<ShowRecords>()->selection;
    EXPECT_TRUE(rows.isReversed);
    EXPECT_TRUE(rows.isUtc);
    EXPECT_TRUE(rows.isFull);
    EXPECT_FALSE(rows.usePager);
    EXPECT_EQ(rows.cursor, (RowCursor{command, 7, 5.5}));
  }
  const auto parsed = parse(
      {"events", "-f", "--all-names", "--own", "--after-cursor", "events:7@5", "--show-cursor"});
  ASSERT_TRUE(std::holds_alternative<Command>(parsed));
  const auto& events = *std::get<Command>(parsed).asked<ShowEvents>();
  EXPECT_TRUE(events.hasAllNames);
  EXPECT_TRUE(events.hasOwnEvents);
  EXPECT_TRUE(events.selection.follow);
  EXPECT_TRUE(events.selection.showCursor);
  EXPECT_TRUE(events.selection.usePager);
  EXPECT_EQ(events.selection.afterCursor, (RowCursor{"events", 7, 5}));
}

TEST(CommandLineTest, OptionsForRowsThatContradictEachOtherAreRefused) {
  EXPECT_NE(errorOf({"events", "-r", "-f"}).find("--reverse"), std::string::npos);
  EXPECT_NE(
      errorOf({"link", "--cursor", "link:1@1", "--after-cursor", "link:1@1"}).find("--cursor"),
      std::string::npos);
}

// The parsed form of a command that is not a request.
template <typename T>
T runOf(const Words& words) {
  const auto parsed = parse(words);
  const auto* command = std::get_if<Command>(&parsed);
  if (command == nullptr) {
    ADD_FAILURE() << std::get<CommandLineText>(parsed).text;
    return {};
  }
  const T* asked = command->asked<T>();
  if (asked != nullptr) return *asked;
  ADD_FAILURE() << "it asks for something else";
  return {};
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
            errorOf({"send", "--type", "x"}).replace(10, 4, "link"));
}

TEST(CommandLineTest, LinkMessagesAreChosenByNamesToo) {
  const auto link = runOf<ShowRecords>({"link", "--category", "Session_Playback", "--category",
                                        "error", "--type", "Start", "--type", "State"});

  EXPECT_EQ(link.categories, (std::vector<std::int64_t>{0x08000004, 11}));
  EXPECT_EQ(link.types, (std::vector<std::int64_t>{1, 18}));
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
            "halvoxctl create: ID: \"x\" is not a reporter ID; expected a whole number of 64 bits, "
            "such as 7");
  EXPECT_EQ(errorOf({"create"}), "halvoxctl create: ID is required");
  EXPECT_EQ(
      errorOf({"list", "--timeout", "0"}),
      "halvoxctl list: --timeout: \"0\" is not a time; expected seconds, more than 0, such as "
      "0.5 or 10");
  EXPECT_EQ(errorOf({"configure", "7", "{"}),
            "halvoxctl configure: JSON: line 1, column 2: expected a name in double quotes, found "
            "the end of the text");
}

TEST(CommandLineTest, WrongCountsAndActionsAreNamedWithWhatIsExpected) {
  for (const std::string command : {"events", "metrics", "power", "link", "snapshots", "summary"}) {
    EXPECT_EQ(
        errorOf({command, "--last", "x"}),
        "halvoxctl " + command +
            ": --last: \"x\" is not a number; expected a whole number of 0 or more, such as 10");
    EXPECT_NE(errorOf({command, "--last", "-1"}), "");
  }
  EXPECT_EQ(errorOf({"preferences", "frob", "org.example"}),
            "halvoxctl preferences: ACTION: \"frob\" is not known; expected get, set or unset");
}

TEST(CommandLineTest, PreferencesAreGotSetAndUnset) {
  using Action = Preferences::Action;

  EXPECT_EQ(runOf<Preferences>({"preferences", "get", "d"}).action, Action::kGet);
  EXPECT_EQ(runOf<Preferences>({"preferences", "set", "d", "k", "v"}).action, Action::kSet);
  EXPECT_EQ(runOf<Preferences>({"preferences", "unset", "d", "k"}).action, Action::kUnset);
}

TEST(CommandLineTest, ErrorsNameTheCommandBelowAnother) {
  EXPECT_EQ(errorOf({"trace", "export", "f"}), "halvoxctl trace export: --to is required");
  EXPECT_EQ(errorOf({"link", "--session", "x"}),
            "halvoxctl link: --session: \"x\" is not a number; expected a whole number");
}

TEST(CommandLineTest, AnUnknownCommandIsAnsweredWithTheKnownOnes) {
  const std::string error = errorOf({"craete", "7"});

  EXPECT_EQ(error.substr(0, 46), "halvoxctl: there is no command \"craete\"; expec");
  EXPECT_NE(error.find("set-type"), std::string::npos);
  EXPECT_NE(error.find("events"), std::string::npos);
}

TEST(CommandLineTest, ACommandThatIsMissingOrUnknownIsAnsweredWithThoseOfItsPlace) {
  EXPECT_EQ(errorOf({}).substr(0, 56), "halvoxctl: a command is missing; expected create, set-ty");
  EXPECT_EQ(errorOf({"trace"}),
            "halvoxctl trace: a command is missing; expected record, show, export");
  EXPECT_EQ(errorOf({"trace", "throw"}),
            "halvoxctl trace: there is no command \"throw\"; expected record, show, export");
  EXPECT_EQ(errorOf({"--socket"}).substr(0, 20), "halvoxctl: --socket:");
  EXPECT_NE(errorOf({"--timeout", "x", "trace"}).find("--timeout:"), std::string::npos);
}

TEST(CommandLineTest, ArgumentsTooManyAreRefused) {
  EXPECT_NE(errorOf({"create", "7", "8"}), "");
  EXPECT_NE(errorOf({"list", "--nonsense"}), "");
  EXPECT_NE(errorOf({}), "");
}

// All commands, as the error about an unknown command lists them, followed by the sub-commands.
std::vector<Words> allCommands() {
  std::istringstream list(errorOf({"nonesuch"}));
  std::vector<Words> commands;
  std::string word;
  while (list >> word && word != "expected") {
  }
  while (list >> word) commands.push_back({word.substr(0, word.find(','))});
  for (const char* below : {"show", "extract"}) commands.push_back({"snapshots", below});
  for (const char* below : {"record", "show", "export"}) commands.push_back({"trace", below});
  return commands;
}

std::string helpOf(Words words) {
  words.emplace_back("--help");
  const auto parsed = parse(words);
  const auto* text = std::get_if<CommandLineText>(&parsed);
  if (text == nullptr || text->status != ExitStatus::kDone) return "";
  return text->text;
}

TEST(CommandLineTest, EventsOfASessionAreNotFollowed) {
  EXPECT_EQ(errorOf({"events", "--session", "7"}), "");
  EXPECT_NE(errorOf({"events", "--session", "7", "--follow"}), "");
}

TEST(CommandLineTest, ACompareTakesTwoPeriods) {
  EXPECT_EQ(errorOf({"report", "--compare", "yesterday", "today"}), "");
  EXPECT_NE(errorOf({"report", "--compare", "yesterday"}), "");
  EXPECT_NE(errorOf({"report", "--compare", "yesterday", "today", "today"}), "");
  EXPECT_NE(helpOf({"report"}).find("--compare BEFORE AFTER "), std::string::npos);
  EXPECT_EQ(helpOf({"report"}).find("x 2"), std::string::npos);
}

TEST(CommandLineTest, EveryCommandHasHelpWithAnExampleOfItself) {
  ASSERT_GT(allCommands().size(), 25U);
  for (const Words& words : allCommands()) {
    std::string name = "halvoxctl";
    for (const auto& word : words) name += " " + word;
    const std::string help = helpOf(words);

    EXPECT_NE(help.find("Usage: " + name + " "), std::string::npos) << name;
    const auto example = help.find("Example:\n");
    ASSERT_NE(example, std::string::npos) << name;
    EXPECT_NE(help.find(name, example), std::string::npos) << name;
  }
}

TEST(CommandLineTest, HelpHasNoLongLinesAndNoGaps) {
  auto all = allCommands();
  all.push_back({});
  for (const Words& words : all) {
    const std::string help = helpOf(words);
    std::istringstream lines(help);
    for (std::string line; std::getline(lines, line);) EXPECT_LE(line.size(), 100U) << line;
    EXPECT_EQ(help.find("\n\n\n"), std::string::npos) << help;
  }
}

TEST(CommandLineTest, HelpShowsTheSocketOnlyForRequestsToTheService) {
  for (const Words& words : {Words{}, Words{"list"}, Words{"run"}, Words{"trace", "record"}}) {
    EXPECT_NE(helpOf(words).find("--socket"), std::string::npos);
    EXPECT_NE(helpOf(words).find("--timeout"), std::string::npos);
  }
  for (const Words& words : {Words{"events"}, Words{"drivers"}, Words{"snapshots", "show"}}) {
    EXPECT_EQ(helpOf(words).find("--socket"), std::string::npos);
    EXPECT_EQ(helpOf(words).find("--timeout"), std::string::npos);
  }
}

TEST(CommandLineTest, SqlTakesAQueryOrReadsTheInput) {
  const auto asked = [](const Words& words) {
    return *std::get<Command>(parse(words)).asked<RunSql>();
  };
  EXPECT_EQ(asked({"sql", "SELECT 1", "--database", "/d"}).query, "SELECT 1");
  EXPECT_EQ(asked({"sql", "SELECT 1", "--database", "/d"}).database, "/d");
  EXPECT_EQ(asked({"sql"}).query, "");
}

TEST(CommandLineTest, ExplainTakesATargetAndTimes) {
  const auto asked =
      runOf<Explain>({"explain", "-1", "--since", "@5", "--until", "@9.5", "--database", "/d"});

  EXPECT_EQ(asked.target, "-1");
  EXPECT_EQ(asked.since, 5.0);
  EXPECT_EQ(asked.until, 9.5);
  EXPECT_EQ(asked.database, "/d");
  EXPECT_EQ(errorOf({"explain"}), "halvoxctl explain: TARGET is required");
}

TEST(CommandLineTest, FieldsAreChosenByApplicationCategoryTypeAndTime) {
  const auto fields =
      runOf<ShowFields>({"fields", "--app", "a*", "--category", "Session_Playback", "--type",
                         "Start", "--since", "@5", "--until", "@9.5", "--database", "/d"});

  EXPECT_EQ(fields.applications, std::vector<std::string>{"a*"});
  EXPECT_EQ(fields.categories, std::vector<std::uint32_t>{0x08000004});
  EXPECT_EQ(fields.types, std::vector<std::uint16_t>{1});
  EXPECT_EQ(fields.since, 5.0);
  EXPECT_EQ(fields.until, 9.5);
  EXPECT_EQ(fields.database, "/d");
}

TEST(CommandLineTest, ExportTakesAFileAndTimes) {
  const auto asked = [](const Words& words) {
    return *std::get<Command>(parse(words)).asked<ExportRecords>();
  };
  const auto request =
      asked({"export", "--format", "sqlite", "--to", "f.db", "--since", "@5", "--until", "@9.5"});
  EXPECT_EQ(request.to, "f.db");
  EXPECT_EQ(request.since, 5);
  EXPECT_EQ(request.until, 9.5);
  EXPECT_FALSE(request.replace);
  EXPECT_TRUE(asked({"export", "-o", "f", "--force"}).replace);
  EXPECT_EQ(asked({"export", "--output", "f"}).format, ExportFormat::kSqlite);
  EXPECT_EQ(asked({"export", "--format", "jsonl"}).to, "-");
}

TEST(CommandLineTest, ExportTakesKindsAndApplications) {
  const auto asked = [](const Words& words) {
    return *std::get<Command>(parse(words)).asked<ExportRecords>();
  };
  const auto some = asked({"export", "--format", "csv", "--kind", "power", "--kind", "link",
                           "--app", "a*", "--app", "b"});
  EXPECT_FALSE(some.kinds.events);
  EXPECT_TRUE(some.kinds.power);
  EXPECT_TRUE(some.kinds.link);
  EXPECT_EQ(some.applications, (Words{"a*", "b"}));
  EXPECT_TRUE(asked({"export", "--format", "csv"}).kinds.snapshots);
  EXPECT_TRUE(asked({"export", "--format", "csv"}).kinds.losses);
  EXPECT_NE(errorOf({"export", "--kind", "event", "-o", "f"}).find("expected one of events, "),
            std::string::npos);
}

TEST(CommandLineTest, ExportNamesTheFormsThatItHas) {
  EXPECT_NE(errorOf({"export", "--to", "f", "--format", "xml"}).find("sqlite"), std::string::npos);
  EXPECT_NE(errorOf({"export"}).find("--output"), std::string::npos);
  EXPECT_NE(errorOf({"export", "--format", "perfetto", "--kind", "link"}).find("shows streams"),
            std::string::npos);
}

TEST(CommandLineTest, HelpOnCreateSaysHowLongASessionLives) {
  const auto parsed = parse({"create", "--help"});

  EXPECT_NE(std::get<CommandLineText>(parsed).text.find("lives as long as the connection"),
            std::string::npos);
}

TEST(CommandLineTest, TheHelpOfTheShellIsAboutItsLines) {
  const auto parsed = parse({"--help"}, "", CommandSource::kScriptLine);
  const std::string& text = std::get<CommandLineText>(parsed).text;

  EXPECT_NE(text.find("Usage: COMMAND [ARGUMENT]...\n"), std::string::npos) << text;
  EXPECT_EQ(text.find("Usage: [OPTIONS]"), std::string::npos) << text;
  EXPECT_NE(text.find("'quit'"), std::string::npos) << text;
}

TEST(CommandLineTest, PrintsItsVersion) {
  std::istringstream noInput;
  const auto parsed = parseCommandLine({"--version"}, CommandSource::kArguments, noInput,
                                       "halvoxctl 1.2\nBuilt with: x");

  EXPECT_EQ(std::get<CommandLineText>(parsed).text, "halvoxctl 1.2\nBuilt with: x\n");
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
