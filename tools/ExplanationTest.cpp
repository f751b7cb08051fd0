#include "tools/Explanation.h"

#include <algorithm>
#include <sstream>

#include <gtest/gtest.h>

#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

Explanation sample() {
  Explanation explanation{.kind = "event", .subject = "Event A.B: 2 messages"};
  explanation.name = {"It is named so because of this and of that."};
  explanation.sinks = {{.name = "events",
                        .took = Explanation::Sink::Took::kYes,
                        .messages = 2,
                        .record = 7,
                        .why = "The store has them."},
                       {.name = "link", .why = "It is not known."}};
  explanation.settings = {{"link.backend", "local", "It decides."}};
  explanation.unknown = {"Nothing else."};
  return explanation;
}

TEST(ExplanationTest, IsPrintedInSectionsWithAlignedColumns) {
  std::ostringstream out;

  printExplanation(sample(), out, std::nullopt);

  EXPECT_EQ(out.str(),
            "Event A.B: 2 messages\n"
            "\n"
            "Name\n"
            "  It is named so because of this and of that.\n"
            "\n"
            "SINK    TOOK IT  MESSAGES  RECORD\n"
            "events  yes             2       7\n"
            "link    unknown\n"
            "\n"
            "Why\n"
            "  events: The store has them.\n"
            "  link: It is not known.\n"
            "\n"
            "SETTING       VALUE\n"
            "link.backend  local\n"
            "\n"
            "  It decides.\n"
            "\n"
            "What the store does not show\n"
            "  Nothing else.\n");
}

TEST(ExplanationTest, FitsANarrowTerminal) {
  std::ostringstream out;

  printExplanation(sample(), out, 24);

  std::istringstream lines(out.str());
  for (std::string line; std::getline(lines, line);) EXPECT_LE(displayWidth(line), 24U) << line;
}

TEST(ExplanationTest, LongWordsStandAlone) {
  EXPECT_EQ(wrapped("a bb ccccccccccccc d", 8, 2), "  a bb\n  ccccccccccccc\n  d\n");
  EXPECT_EQ(wrapped("", 8, 2), "  \n");
}

TEST(ExplanationTest, JsonHasTheSameContent) {
  EXPECT_EQ(explanationJson(sample()),
            R"({"explains":"event","subject":"Event A.B: 2 messages",)"
            R"("name":["It is named so because of this and of that."],"sessions":[],)"
            R"("sinks":[{"sink":"events","took":"yes","messages":2,"record":7,)"
            R"("why":"The store has them."},)"
            R"({"sink":"link","took":"unknown","messages":null,"record":null,)"
            R"("why":"It is not known."}],)"
            R"("settings":[{"key":"link.backend","value":"local","effect":"It decides."}],)"
            R"("unknown":["Nothing else."]})");
}

TEST(ExplanationTest, NothingThatAClientSentDrivesTheTerminal) {
  Explanation explanation = sample();
  explanation.subject = explanation.sinks[0].name = explanation.sinks[0].why = "\x1B[2J";
  std::ostringstream out;
  printExplanation(explanation, out, 80);

  EXPECT_EQ(out.str().find('\x1B'), std::string::npos);
  EXPECT_EQ(explanationJson(explanation).find('\x1B'), std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
