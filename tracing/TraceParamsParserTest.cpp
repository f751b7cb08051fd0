#include "tracing/TraceParamsParser.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::LogLevel;
using platform::Value;
using Texts = std::vector<std::string>;

constexpr const char* kFile = "/traces/params.plist";

Dictionary interval(const char* name, const char* begin, const char* end) {
  return {{"Name", name},
          {"Type", "Interval"},
          {"KTraceCodeBegin", begin},
          {"KTraceCodeEnd", end},
          {"EventsMatchedBy", "Thread"}};
}

Dictionary trace(const char* name, Array points) {
  return {{"Name", name}, {"TraceType", "ktrace"}, {"Children", std::move(points)}};
}

class TraceParamsParserTest : public testing::Test {
 protected:
  TraceParams load(Array traces) {
    platform_.propertyLists.setFile(kFile, Dictionary{{"Children", std::move(traces)}});
    return TraceParamsParser(kFile).loadTraceParams();
  }
  // The trace points of a file with one trace.
  std::vector<TraceDataParams> loadPoints(Array points) {
    return load({trace("T", std::move(points))}).tracePoints;
  }
  Texts errors() const { return platform_.log.texts(LogLevel::kError); }

  platform::FakePlatform platform_;
};

// --- The listener -------------------------------------------------------------------------------

struct Recorder final : TraceParamsParser::Listener {
  void onError(const std::string& sentence) override { errors.push_back(sentence); }
  void onTracePoint(const TraceDataParams& point) override { points.push_back(point.name); }
  Texts errors;
  Texts points;
};

TEST_F(TraceParamsParserTest, ReportsToAListenerInsteadOfLogging) {
  platform_.propertyLists.setFile(
      kFile, Dictionary{{"Children", Array{trace("T", {interval("a", "1", "2"), Array{}})}}});
  Recorder recorder;

  const TraceParams params =
      TraceParamsParser(kFile).loadTraceParams(platform_.propertyLists, recorder);

  EXPECT_EQ(params.tracePoints.size(), 2U);
  EXPECT_EQ(recorder.points, (Texts{"a", "(null)"}));
  ASSERT_EQ(recorder.errors.size(), 2U);
  EXPECT_TRUE(platform_.log.texts(LogLevel::kInfo).empty());
  EXPECT_TRUE(errors().empty());
  EXPECT_EQ(load({trace("T", {interval("a", "1", "2"), Array{}})}).tracePoints.size(), 2U);
  EXPECT_EQ(errors(), recorder.errors);
}

// --- What the file says -------------------------------------------------------------------------

TEST_F(TraceParamsParserTest, ReadsATraceWithAnInterval) {
  const TraceParams params =
      load({trace("StartupLatency", {interval("IOStart", "0x1a2b0001", "0x1a2b0002")})});

  EXPECT_EQ(params.name, "StartupLatency");
  EXPECT_EQ(params.type, TraceType::kKernelTrace);
  ASSERT_EQ(params.tracePoints.size(), 1U);
  EXPECT_EQ(params.tracePoints[0].name, "IOStart");
  EXPECT_EQ(params.tracePoints[0].kind, TracePointKind::kInterval);
  EXPECT_EQ(params.tracePoints[0].beginCode, 0x1a2b0001U);
  EXPECT_EQ(params.tracePoints[0].endCode, 0x1a2b0002U);
  EXPECT_TRUE(params.tracePoints[0].matchByThread);
  EXPECT_TRUE(errors().empty());
}

TEST_F(TraceParamsParserTest, FirstNameAndFirstSignpostTypeWinAndAllPointsCount) {
  Dictionary second = trace("Second", {interval("b", "3", "4")});
  second.set(platform::Key("TraceType"), "OSSignpost");
  Dictionary third = trace("Third", {interval("c", "5", "6")});

  const TraceParams params = load({trace("First", {interval("a", "1", "2")}), second, third});

  EXPECT_EQ(params.name, "First");
  EXPECT_EQ(params.type, TraceType::kSignpost);
  ASSERT_EQ(params.tracePoints.size(), 3U);
  EXPECT_EQ(params.tracePoints[0].name, "a");
  EXPECT_EQ(params.tracePoints[1].name, "b");
  EXPECT_EQ(params.tracePoints[2].name, "c");
}

TEST_F(TraceParamsParserTest, ImpulseEndsWithItsBeginCode) {
  Dictionary point = interval("a", "0x10", "0x20");
  point.set(platform::Key("Type"), "Impulse");

  const auto points = loadPoints({point});

  EXPECT_EQ(points[0].kind, TracePointKind::kImpulse);
  EXPECT_EQ(points[0].beginCode, 0x10U);
  EXPECT_EQ(points[0].endCode, 0x10U);
}

TEST_F(TraceParamsParserTest, LevelHasNoEndCode) {
  Dictionary point = interval("a", "0x10", "0x20");
  point.set(platform::Key("Type"), "Level");

  const auto points = loadPoints({point});

  EXPECT_EQ(points[0].kind, TracePointKind::kLevel);
  EXPECT_EQ(points[0].beginCode, 0x10U);
  EXPECT_EQ(points[0].endCode, 0U);
}

TEST_F(TraceParamsParserTest, UnknownTypeIsThatOfThePointBeforeWithItsOwnCodes) {
  Dictionary unknown = interval("b", "0x30", "0x40");
  unknown.set(platform::Key("Type"), "Wave");

  const auto points = loadPoints({interval("a", "0x10", "0x20"), unknown});

  ASSERT_EQ(points.size(), 2U);
  EXPECT_EQ(points[1].kind, TracePointKind::kInterval);
  EXPECT_EQ(points[1].beginCode, 0x30U);
  EXPECT_EQ(points[1].endCode, 0x40U);
  EXPECT_EQ(errors(), Texts{"TracePointType field not recognized or is empty."});
}

TEST_F(TraceParamsParserTest, UnknownTypeIsAlsoThatOfThePointBeforeInAnotherTrace) {
  Dictionary unknown = interval("b", "1", "2");
  unknown.remove(platform::Key("Type"));

  const TraceParams params = load({trace("A", {interval("a", "1", "2")}), trace("B", {unknown})});

  EXPECT_EQ(params.tracePoints[1].kind, TracePointKind::kInterval);
}

TEST_F(TraceParamsParserTest, UnknownTypeOfTheFirstPointIsAnImpulse) {
  Dictionary unknown = interval("a", "0x10", "0x20");
  unknown.set(platform::Key("Type"), "");

  EXPECT_EQ(loadPoints({unknown})[0].kind, TracePointKind::kImpulse);
}

TEST_F(TraceParamsParserTest, MatchesByThreadOnlyForTheExactText) {
  Dictionary process = interval("a", "1", "2");
  process.set(platform::Key("EventsMatchedBy"), "Process");
  Dictionary lowerCase = process;
  lowerCase.set(platform::Key("EventsMatchedBy"), "thread");
  Dictionary missing = process;
  missing.remove(platform::Key("EventsMatchedBy"));

  for (const auto& point : loadPoints({process, lowerCase, missing})) {
    EXPECT_FALSE(point.matchByThread);
  }
}

TEST_F(TraceParamsParserTest, LogsWhichCodesItRead) {
  loadPoints({interval("a", "0x2A", "FFFFFFFF")});

  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo),
            Texts{"Loading tracepoint : 42 and -1 \n finished parsing."});
}

// --- Codes --------------------------------------------------------------------------------------

TEST_F(TraceParamsParserTest, CodesAreHexadecimalWithOrWithoutPrefix) {
  const struct {
    const char* text;
    std::uint32_t code;
  } cases[] = {{"0x2A", 42},      {"2A", 42}, {"2a", 42},          {"0X2a", 42}, {"zz", 0},
               {"", 0},           {"0x", 0},  {"2Azz", 42},        {"-1", 0},    {" 2A", 0},
               {"FFFFFFFF", ~0U}, {"0xg", 0}, {"1FFFFFFFFF", ~0U}, {"0x0x1", 0}, {"(null)", 0}};
  for (const auto& [text, code] : cases) {
    EXPECT_EQ(loadPoints({interval("a", text, "0")})[0].beginCode, code) << text;
  }
}

TEST_F(TraceParamsParserTest, NumberAsACodeIsReadByItsDecimalText) {
  Dictionary point = interval("a", "", "");
  point.set(platform::Key("KTraceCodeBegin"), 42);
  point.set(platform::Key("KTraceCodeEnd"), true);

  const auto points = loadPoints({point});

  EXPECT_EQ(points[0].beginCode, 0x42U);
  EXPECT_EQ(points[0].endCode, 1U);
}

TEST_F(TraceParamsParserTest, ContainersAsCodesAreZero) {
  Dictionary point = interval("a", "", "");
  point.set(platform::Key("KTraceCodeBegin"), Array{"1"});
  point.set(platform::Key("KTraceCodeEnd"), Dictionary{{"1", "1"}});

  const auto points = loadPoints({point});

  EXPECT_EQ(points[0].beginCode, 0U);
  EXPECT_EQ(points[0].endCode, 0U);
}

// --- What is missing or wrong -------------------------------------------------------------------

TEST_F(TraceParamsParserTest, MissingKeysOfAPointHaveTheirSubstitutes) {
  const auto points = loadPoints({Dictionary{{"Type", "Interval"}}});

  EXPECT_EQ(points[0].name, "(null)");
  EXPECT_EQ(points[0].beginCode, 0U);
  EXPECT_EQ(points[0].endCode, 0U);
  EXPECT_FALSE(points[0].matchByThread);
}

TEST_F(TraceParamsParserTest, MissingNameOfATraceIsTheTextOfNothing) {
  EXPECT_EQ(load({Dictionary{{"Children", Array{}}}}).name, "(null)");
}

TEST_F(TraceParamsParserTest, EmptyNameIsLoggedAndTheNextTraceGivesTheName) {
  EXPECT_EQ(load({trace("", {}), trace("Second", {})}).name, "Second");
  EXPECT_EQ(errors(), Texts{"Description not found in the plist file"});
}

TEST_F(TraceParamsParserTest, NameOfAnotherKindIsItsText) {
  Dictionary one = trace("", {});
  one.set(platform::Key("Name"), 7);

  EXPECT_EQ(load({one}).name, "7");
}

TEST_F(TraceParamsParserTest, FileThatCannotBeReadIsLoggedThreeTimesAndGivesAnEmptyRecord) {
  const TraceParams params = TraceParamsParser("/none").loadTraceParams();

  EXPECT_EQ(params.name, "");
  EXPECT_EQ(params.type, TraceType::kKernelTrace);
  EXPECT_TRUE(params.tracePoints.empty());
  EXPECT_EQ(errors(), (Texts{"Reading from plist file failed with error: no file /none",
                             "Reading from plist file failed with error: no bytes",
                             "No valid input found in plist.",
                             "Failed to load Trace Parameter Array with error: "
                             "expected an array, found (null)"}));
}

TEST_F(TraceParamsParserTest, BrokenFileIsLoggedAndGivesAnEmptyRecord) {
  platform_.propertyLists.setBrokenFile(kFile);

  EXPECT_TRUE(TraceParamsParser(kFile).loadTraceParams().tracePoints.empty());
  EXPECT_EQ(errors()[0], "Reading from plist file failed with error: not a property list");
  EXPECT_EQ(errors()[1], "No valid input found in plist.");
}

TEST_F(TraceParamsParserTest, RootThatIsNotADictionaryGivesAnEmptyRecord) {
  platform_.propertyLists.setFile(kFile, Array{"Children"});

  const TraceParams params = TraceParamsParser(kFile).loadTraceParams();

  EXPECT_EQ(params.name, "");
  EXPECT_EQ(errors(), Texts{"Failed to load Trace Parameter Array with error: "
                            "expected an array, found (null)"});
}

TEST_F(TraceParamsParserTest, ListOfTracesOfAnotherKindHoldsNothing) {
  for (const Value& wrong :
       {Value("(a, b)"), Value(1), Value(Dictionary{{"a", 1}}), Value(platform::Date{0})}) {
    platform_.propertyLists.setFile(kFile, Dictionary{{"Children", wrong}});

    EXPECT_EQ(TraceParamsParser(kFile).loadTraceParams().name, "");
  }
  EXPECT_EQ(errors(), (Texts{"Failed to load Trace Parameter Array with error: "
                             "expected an array, found a string",
                             "Failed to load Trace Parameter Array with error: "
                             "expected an array, found a number",
                             "Failed to load Trace Parameter Array with error: "
                             "expected an array, found a dictionary",
                             "Failed to load Trace Parameter Array with error: "
                             "expected an array, found a date"}));
}

TEST_F(TraceParamsParserTest, TraceOfAnotherKindIsOneWithoutKeys) {
  const TraceParams params = load({"text", trace("Second", {interval("a", "1", "2")})});

  EXPECT_EQ(params.name, "(null)");
  EXPECT_EQ(params.tracePoints.size(), 1U);
  EXPECT_EQ(errors(), (Texts{"Failed to load Trace Parameter dictionary with error : "
                             "expected a dictionary, found a string",
                             "Failed to read the Trace Points from the plist file with error: "
                             "expected an array, found (null)"}));
}

TEST_F(TraceParamsParserTest, PointOfAnotherKindIsOneWithoutKeysOfTheTypeBefore) {
  const auto points = loadPoints({interval("a", "1", "2"), Array{}});

  ASSERT_EQ(points.size(), 2U);
  EXPECT_EQ(points[1].name, "(null)");
  EXPECT_EQ(points[1].kind, TracePointKind::kInterval);
  EXPECT_EQ(points[1].beginCode, 0U);
  EXPECT_EQ(errors(),
            (Texts{"Failed to read Trace Point from Trace Points dictionary. Failed with error: "
                   "expected a dictionary, found an array",
                   "TracePointType field not recognized or is empty."}));
}

TEST_F(TraceParamsParserTest, LinesGoToTheTracesCategoryUnderTheParsersName) {
  static_cast<void>(TraceParamsParser("/nowhere").loadTraceParams());

  const auto line = platform_.log.lines().at(0);
  EXPECT_EQ(line.category, "hvrt");
  EXPECT_EQ(line.line.substr(0, 26), "        TraceParamsParser:");
}

// --- Paths --------------------------------------------------------------------------------------

TEST_F(TraceParamsParserTest, RelativeNameStartsFromTheCurrentDirectory) {
  platform_.propertyLists.setCurrentDirectory("/here");
  platform_.propertyLists.setFile("/here/sub/params.plist",
                                  Dictionary{{"Children", Array{trace("Relative", {})}}});

  EXPECT_EQ(TraceParamsParser("sub/params.plist").loadTraceParams().name, "Relative");
}

TEST_F(TraceParamsParserTest, EmptyNameIsTheCurrentDirectory) {
  static_cast<void>(TraceParamsParser("").loadTraceParams());

  EXPECT_EQ(errors()[0], "Reading from plist file failed with error: no file /current/");
}

}  // namespace
}  // namespace halvox
