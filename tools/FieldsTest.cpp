#include "tools/Fields.h"

#include <sstream>
#include <string>

#include "analysis/FieldCollector.h"
#include <gtest/gtest.h>

#include "tools/StoredEventsFixture.h"

namespace halvox::tools {
namespace {

class FieldsTest : public StoredEventsFixture {
 protected:
  std::string shown(ShowFields request, OutputForm form = OutputForm::kText) {
    request.database = directory();
    std::ostringstream out;
    EXPECT_EQ(showFields(request, form, out, -1, errors_), ExitStatus::kDone);
    return out.str();
  }
  // The keys that are shown, in order, with a blank after each.
  std::string keys(const ShowFields& request) {
    std::istringstream lines(shown(request));
    std::string keys;
    std::string line;
    std::getline(lines, line);
    EXPECT_EQ(line.substr(0, 3), "KEY");
    while (std::getline(lines, line)) keys += line.substr(0, line.find(' ') + 1);
    return keys;
  }

  std::ostringstream errors_;
};

TEST_F(FieldsTest, TheTableHasTypesCountsExamplesAndPlaces) {
  store("com.tarno.halvox.Volume.State", {{"gain", 0.5}});
  store("com.tarno.haptics.Volume.State", {{"gain", 0.5}});
  store("com.tarno.halvox.Playback.Start", {{"gain", "high"}, {"n", 7}});

  EXPECT_EQ(shown({}),
            "KEY   TYPE          RECORDS  EXAMPLE  IN\n"
            "gain  number, text        2  high     Volume.State, Playback.Start\n"
            "n     integer             1  7        Playback.Start\n");
}

TEST_F(FieldsTest, JsonHasEverything) {
  store("com.tarno.halvox.Volume.State", {{"gain", 0.5}});

  EXPECT_EQ(shown({}, OutputForm::kJson),
            R"({"key":"gain","types":{"number":1},"records":1,"events":1,"link_messages":0,)"
            R"("power_events":0,"snapshots":0,"first":100.0,"last":100.0,"example":0.5,)"
            R"("example_is_cut":false,"in":[{"name":"Volume.State","count":1}],"in_others":0})"
            "\n");
}

TEST_F(FieldsTest, ACutExampleIsATextInJson) {
  std::vector<platform::Value> values(1000, 7);
  store("com.tarno.halvox.Volume.State", {{"list", platform::Array(values)}});

  const std::string json = shown({}, OutputForm::kJson);

  EXPECT_NE(json.find(R"("example":"[7,7,7)"), std::string::npos) << json;
  EXPECT_NE(json.find(R"("example_is_cut":true)"), std::string::npos);
  EXPECT_NE(shown({}).find("7,7,…  Volume.State\n"), std::string::npos) << shown({});
}

TEST_F(FieldsTest, ChoosesByApplicationCategoryTypeAndTime) {
  store("com.tarno.halvox.Session_Playback.Start",
        {{"a", 1}, {"HostApplicationDisplayID", "player"}});
  store("com.tarno.halvox.Playback.Stop", {{"b", 1}});
  store("other", {{"c", 1}});

  EXPECT_EQ(keys({.applications = {"pl*"}}), "HostApplicationDisplayID a ");
  EXPECT_EQ(keys({.categories = {4}}), "HostApplicationDisplayID a b ");
  EXPECT_EQ(keys({.categories = {0x08000004}}), "HostApplicationDisplayID a ");
  EXPECT_EQ(keys({.types = {2}}), "b ");
  EXPECT_EQ(keys({.since = 102}), "c ");
  EXPECT_EQ(keys({.until = 101}), "HostApplicationDisplayID a ");
  EXPECT_EQ(keys({.types = {18}}), "");
}

TEST_F(FieldsTest, NothingThatAClientSentDrivesTheTerminal) {
  store("evil\x1B[2J", {{"k\x1B\xC2\x9B", "\x1B[2J\n"}});

  for (const auto form : {OutputForm::kText, OutputForm::kJson}) {
    const std::string text = shown({}, form);
    EXPECT_EQ(text.find_first_of("\x1B\x7F"), std::string::npos);
    EXPECT_EQ(text.find("\xC2\x9B"), std::string::npos);
  }
}

TEST_F(FieldsTest, ReportsWhatItDoesNotShow) {
  platform::Dictionary many;
  for (std::size_t key = 0; key < analysis::FieldCollector::kMostKeys + 2; ++key) {
    many.set("k" + std::to_string(key), 1);
  }
  many.set(std::string(analysis::FieldCollector::kMostKeyBytes + 1, 'l'), 1);
  store("com.tarno.halvox.Volume.State", many);

  shown({});

  EXPECT_NE(errors_.str().find("not shown: 2 values under further keys"), std::string::npos)
      << errors_.str();
  EXPECT_NE(errors_.str().find("not shown: 1 values under keys of more than 256 bytes"),
            std::string::npos);
}

TEST_F(FieldsTest, AMissingStoreIsReportedAsNoService) {
  std::ostringstream out;

  EXPECT_EQ(showFields({.database = scratch_.path("elsewhere/halvox.db")}, OutputForm::kJson, out,
                       -1, errors_),
            ExitStatus::kNoService);
  EXPECT_NE(out.str().find("\"kind\":\"no-store\""), std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
