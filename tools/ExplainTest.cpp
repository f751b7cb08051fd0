#include "tools/Explain.h"

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "tools/ExplainText.h"
#include "tools/StoredEventsFixture.h"

namespace halvox::tools {
namespace {

class ExplainTest : public StoredEventsFixture {
 protected:
  ExplainTest() { configure(""); }
  ~ExplainTest() override { unsetenv("HALVOX_CONFIG"); }

  void configure(const std::string& more) {
    const std::string path = scratch_.path("halvox.toml");
    std::ofstream(path) << "[storage]\ndirectory = \"" << directory() << "\"\n" << more;
    setenv("HALVOX_CONFIG", path.c_str(), 1);
  }
  // Stores both events of a message of an application.
  void storeMessage(const std::string& name, platform::Dictionary payload, double stamp) {
    payload.set("hvreporting_timestamp", stamp);
    payload.set("HostApplicationDisplayID", "player");
    store("com.tarno.halvox." + name, payload);
    store("com.tarno.longformaudio." + name, payload);
  }
  std::string explained(const std::string& target, ExitStatus status = ExitStatus::kDone) {
    std::ostringstream out;
    std::istringstream in;
    EXPECT_EQ(explain({.target = target}, {}, {in, out, errors_}), status);
    // Lines are wrapped for people.
    std::string text = out.str();
    for (std::size_t at = 0; (at = text.find("\n  ", at)) != std::string::npos;) {
      text.replace(at, 3, " ");
    }
    return text;
  }

  std::ostringstream errors_;
};

// Whether a sink took it, as the table of the text says.
std::string tookOf(const std::string& text, const std::string& sink) {
  const std::size_t line = text.find("\n" + sink + "  ");
  if (line == std::string::npos) return "no such sink";
  const std::size_t begin = text.find_first_not_of(' ', line + 1 + sink.size());
  return text.substr(begin, text.find_first_of(" \n", begin) - begin);
}

#define EXPECT_SAYS(text, part) EXPECT_NE((text).find(part), std::string::npos) << (text)

TEST_F(ExplainTest, AnEventIsExplainedByItsNameAndItsSinks) {
  storeMessage("Session_Playback.Start", {{"n", 1}}, 10);
  storeMessage("Session_Playback.Start", {{"n", 2}}, 11);

  for (const char* target : {"com.tarno.longformaudio.Session_Playback.Start",
                             "com.tarno.halvox.Session_Playback.Start", "Session_Playback.Start"}) {
    const std::string text = explained(target);

    EXPECT_SAYS(text, ": 2 messages, from ");
    EXPECT_SAYS(text, "The category is Session_Playback (0x08000004).");
    EXPECT_SAYS(text, "The type is Start (1).");
    EXPECT_EQ(tookOf(text, "events, name of all services"), "yes");
    EXPECT_EQ(tookOf(text, "events, name of the service type"), "yes");
    EXPECT_EQ(tookOf(text, "link, in a session"), "unknown");
    EXPECT_EQ(tookOf(text, "link, single message"), "no");
  }
}

TEST_F(ExplainTest, AServiceTypeInTheNameSelects) {
  storeMessage("Session_Playback.Start", {{"n", 1}}, 10);

  EXPECT_SAYS(explained("com.tarno.haptics.Session_Playback.Start"), ": 0 messages\n");
}

TEST_F(ExplainTest, AnEventThatIsNotWantedIsExplainedByTheSetting) {
  storeMessage("Session_Playback.Start", {{"n", 1}}, 10);
  configure("[analytics]\nwanted = [\"com.tarno.halvox.*\"]\n");

  EXPECT_SAYS(explained("com.tarno.haptics.Volume.State"),
              "No pattern of analytics.wanted matches com.tarno.haptics.Volume.State.");
  EXPECT_SAYS(explained("Volume.State"),
              "The store has no event of com.tarno.halvox.Volume.State.");
}

TEST_F(ExplainTest, ARecordIsExplainedWithTheOneThatItRepeats) {
  storeMessage("Session_Playback.Start", {{"n", 1}}, 10);
  storeMessage("Session_Playback.Start", {{"n", 1}}, 11);

  const std::string text = explained("3");

  EXPECT_SAYS(text, "Record 3: com.tarno.halvox.Session_Playback.Start, ");
  EXPECT_SAYS(text, "Its application is player.");
  EXPECT_SAYS(text, "It equals record 1, the message of the same category");
  EXPECT_EQ(tookOf(text, "link, in a session"), "unknown");
  EXPECT_EQ(tookOf(text, "power log"), "no");
  EXPECT_SAYS(explained("1"), "The store has no earlier message of the same category");
}

TEST_F(ExplainTest, NoSinkIsSaidToHaveTakenWhatTheStoreDoesNotShow) {
  storeMessage("Session_Generic.Joulebook", {{"EngineOnTime", 4.5}}, 10);
  storeMessage("Session_Playback.IssueDetector", {{"issue_type", "xrun"}}, 10);

  EXPECT_EQ(tookOf(explained("1"), "power log"), "unknown");
  EXPECT_EQ(tookOf(explained("3"), "issue metrics"), "unknown");
}

TEST_F(ExplainTest, AnEventThatIsNotAMessageIsSaidToBeTheServicesOwn) {
  store("com.tarno.halvox.hvreportingclientuptime", {{"seconds", 1.5}});

  EXPECT_SAYS(explained("com.tarno.halvox.hvreportingclientuptime"), "the service makes it itself");
  EXPECT_SAYS(explained("1"), "the service makes it itself");
}

TEST_F(ExplainTest, WhatIsNotInTheStoreIsRefused) {
  store("com.tarno.halvox.Volume.State", {{"n", 1}});

  explained("99", ExitStatus::kRefused);
  EXPECT_SAYS(errors_.str(), "no stored message is of a session 99");
  explained("nonesuch", ExitStatus::kRefused);
  EXPECT_SAYS(errors_.str(), "\"nonesuch\" is not in the store");
  explained("Session_Playback.Begin", ExitStatus::kRefused);
}

TEST(ExplainTextTest, NamesOfUnlistedNumbersAreNamesToo) {
  for (const char* category : {"Undefined", "_Record", "Session_Undefined", "_Undefined", "IO"}) {
    EXPECT_TRUE(isMessageName({category, "Start"})) << category;
    EXPECT_EQ(eventNamesOf({category, "Start"}).ofAll,
              std::string("com.tarno.halvox.") + category + ".Start");
  }
  EXPECT_TRUE(isMessageName({"Volume", "Generic"}));
  EXPECT_FALSE(isMessageName({"Volume", "generic"}));
  EXPECT_FALSE(isMessageName({"Loudness", "Start"}));
}

}  // namespace
}  // namespace halvox::tools
