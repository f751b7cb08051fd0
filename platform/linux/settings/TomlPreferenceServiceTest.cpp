#include "platform/linux/settings/TomlPreferenceService.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <time.h>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/linux/settings/SettingsFixture.h"

namespace halvox::platform::linux_ {
namespace {

using testing::Pair;
using testing::UnorderedElementsAre;

class TomlPreferenceServiceTest : public SettingsFixture {
 protected:
  std::optional<Value> at(std::string_view key, std::string_view domain = "domain",
                          std::string_view user = "mobile") const {
    return service_.CFPreferencesCopyValue(key, domain, user);
  }
  void store(std::string_view text) { write(domainFile("domain"), text); }

  PreferenceReader reader_{preferences(), platform_.log};
  TomlPreferenceService service_{reader_, platform_.statistics};
};

TEST_F(TomlPreferenceServiceTest, WithoutADirectoryThereAreNoValues) {
  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(platform_.log.lines().size(), 0U);
}

TEST_F(TomlPreferenceServiceTest, ReadsTheFileOfTheUserAndTheDomain) {
  write(preferences() / "mobile" / "one.toml", "key = \"of mobile\"");
  write(preferences() / "root" / "one.toml", "key = \"of root\"");

  EXPECT_EQ(at("key", "one"), Value("of mobile"));
  EXPECT_EQ(at("key", "one", "root"), Value("of root"));
  EXPECT_EQ(at("key", "two"), std::nullopt);
  EXPECT_EQ(at("other", "one"), std::nullopt);
}

TEST_F(TomlPreferenceServiceTest, SuitesAreDomainsOfTheUserMobile) {
  store("key = 7");

  EXPECT_EQ(service_.suiteValue("domain", "key"), Value(7));
}

TEST_F(TomlPreferenceServiceTest, EveryCallReadsAfresh) {
  for (int number = 0; number < 100; ++number) {
    // All versions of the file have the same size and, within one tick of the clock, the same time.
    store("key = " + std::to_string(100 + number));
    ASSERT_EQ(at("key"), Value(100 + number));
  }
  std::filesystem::remove(domainFile("domain"));
  EXPECT_EQ(at("key"), std::nullopt);
}

TEST_F(TomlPreferenceServiceTest, ScalarsAreWhatTheyMean) {
  store(R"(
text = "ä\tb"
multi = '''a
b'''
yes = true
integer = -9223372036854775808
hex = 0xFF
fraction = 0.5
endless = -inf
)");
  EXPECT_EQ(at("text"), Value("ä\tb"));
  EXPECT_EQ(at("multi"), Value("a\nb"));
  EXPECT_EQ(at("yes")->numberKind(), NumberKind::kBool);
  EXPECT_EQ(at("integer"), Value(INT64_MIN));
  EXPECT_EQ(at("hex")->numberKind(), NumberKind::kInt64);
  EXPECT_EQ(at("fraction"), Value(0.5));
  EXPECT_EQ(at("endless"), Value(-std::numeric_limits<double>::infinity()));
}

TEST_F(TomlPreferenceServiceTest, DatesAreMomentsAndTimesAreTexts) {
  const char* zone = ::getenv("TZ");
  const std::string saved = zone == nullptr ? "" : zone;
  ::setenv("TZ", "XXX-2", 1);  // two hours east
  ::tzset();
  store(R"(
moment = 1970-01-02T01:00:00.5+01:00
local = 1970-01-02T02:00:00
day = 1970-01-02
time = 07:32:00
fine = 07:32:00.250
)");

  EXPECT_EQ(at("moment"), Value(Date{86'400.5}));
  EXPECT_EQ(at("local"), Value(Date{86'400}));
  EXPECT_EQ(at("day"), Value(Date{86'400 - 7200}));
  EXPECT_EQ(at("time"), Value("07:32:00"));
  EXPECT_EQ(at("fine"), Value("07:32:00.25"));
  zone == nullptr ? ::unsetenv("TZ") : ::setenv("TZ", saved.c_str(), 1);
  ::tzset();
}

TEST_F(TomlPreferenceServiceTest, ContainersKeepTheirShape) {
  store(R"(
list = [1, "two", [true]]
inline = { a = 1, b.c = "x" }
[table]
key = []
[[array]]
n = 1
[[array]]
)");

  const Value flag = Array{true};
  EXPECT_EQ(at("list"), Value(Array{1, "two", flag}));
  EXPECT_EQ(at("inline"), Value(Dictionary{{"a", 1}, {"b", Dictionary{{"c", "x"}}}}));
  EXPECT_EQ(at("table"), Value(Dictionary{{"key", Array{}}}));
  EXPECT_EQ(at("array"), Value(Array{Dictionary{{"n", 1}}, Dictionary{}}));
}

TEST_F(TomlPreferenceServiceTest, NamesThatLeaveTheDirectoryAreRefusedAndLoggedOnce) {
  write(scratch_ / "secret.toml", "key = 1");
  for (int turn = 0; turn < 3; ++turn) {
    EXPECT_EQ(at("key", "../secret", "."), std::nullopt);
    EXPECT_EQ(at("key", "secret", ".."), std::nullopt);
    EXPECT_EQ(at("key", "", "mobile"), std::nullopt);
    EXPECT_EQ(at("key", std::string_view("a\0b", 3)), std::nullopt);
    EXPECT_EQ(at("key", std::string(5000, 'a')), std::nullopt);
  }

  EXPECT_EQ(platform_.log.lines().size(), 5U);
  EXPECT_EQ(linesWith("user \"..\", domain \"secret\": expected names that a file can have"), 1U);
}

TEST_F(TomlPreferenceServiceTest, ABrokenFileIsLoggedOnceWithItsPlaceAndCountsAsAbsent) {
  store("key = 1\nother = \n");

  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(at("key"), std::nullopt);

  ASSERT_EQ(platform_.log.lines().size(), 1U);
  EXPECT_EQ(platform_.log.lines()[0].level, LogLevel::kError);
  EXPECT_EQ(linesWith(domainFile("domain").native() + ":2:"), 1U);
}

TEST_F(TomlPreferenceServiceTest, AFixedFileWorksAgainAndIsLoggedOnce) {
  store("key =");
  EXPECT_EQ(at("key"), std::nullopt);
  store("key = 1");

  EXPECT_EQ(at("key"), Value(1));
  EXPECT_EQ(at("key"), Value(1));
  EXPECT_EQ(linesWith("can be read again"), 1U);
  store("key =");
  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(platform_.log.lines().size(), 3U);
}

TEST_F(TomlPreferenceServiceTest, AFileThatIsTooLargeIsNotRead) {
  store("key = 1");
  std::filesystem::resize_file(domainFile("domain"), std::uintmax_t{100} << 20U);

  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(linesWith("expected at most 1048576 bytes, found 104857600"), 1U);

  store("key = 1\n#" + std::string(kLargestPreferenceFile - 10, 'x') + "\n");
  EXPECT_EQ(at("key"), Value(1));
}

TEST_F(TomlPreferenceServiceTest, APipeOrADirectoryInItsPlaceIsLoggedAndBlocksNobody) {
  std::filesystem::create_directories(preferences() / "mobile");
  ASSERT_EQ(::mkfifo(domainFile("domain").c_str(), 0600), 0);
  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(linesWith("expected a regular file"), 1U);

  std::filesystem::create_directories(domainFile("other"));
  EXPECT_EQ(at("key", "other"), std::nullopt);
  EXPECT_EQ(linesWith("expected a regular file"), 2U);
}

TEST_F(TomlPreferenceServiceTest, DeeplyNestedValuesAreAMistakeNotAnEnd) {
  store("key = " + std::string(100'000, '[') + std::string(100'000, ']'));

  EXPECT_EQ(at("key"), std::nullopt);
  EXPECT_EQ(linesWith("expected at most 256 levels of tables and arrays, found more"), 1U);
}

TEST_F(TomlPreferenceServiceTest, KeysOfManyWordsAreAMistakeNotAnEnd) {
  std::string key = "a";
  for (int count = 0; count < 200'000; ++count) key += ".a";
  store(key + " = 1\n");
  EXPECT_EQ(at("a"), std::nullopt);
  EXPECT_EQ(linesWith("expected at most 256 levels of tables and arrays, found more"), 1U);

  store("[" + key + "]\n");
  EXPECT_EQ(at("a"), std::nullopt);
  EXPECT_EQ(linesWith("expected at most 256 levels of tables and arrays, found more"), 2U);
}

TEST_F(TomlPreferenceServiceTest, EveryQuestionIsAccountedFor) {
  store("key = 1");
  write(domainFile("broken"), "=");
  static_cast<void>(at("key"));
  static_cast<void>(at("none"));
  static_cast<void>(at("key", "broken"));
  static_cast<void>(at("key", ".."));

  EXPECT_THAT(platform_.statistics.values("preferences"),
              UnorderedElementsAre(Pair("asked", 4U), Pair("found", 1U), Pair("absent", 1U),
                                   Pair("absent: refused or not readable", 2U)));
}

}  // namespace
}  // namespace halvox::platform::linux_
