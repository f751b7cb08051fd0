#include "tools/Complaint.h"

#include <sstream>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(ComplaintTest, AFailureIsALineForPeopleOnly) {
  std::ostringstream out;
  std::ostringstream errors;
  const Complaint complain("events", OutputForm::kText, out, errors);

  EXPECT_EQ(complain(ExitStatus::kNoService, "no store\x1B"), ExitStatus::kNoService);

  EXPECT_EQ(errors.str(), "halvoxctl events: no store\\u001b\n");
  EXPECT_EQ(out.str(), "");
}

TEST(ComplaintTest, InJsonItIsAnObjectBesides) {
  std::ostringstream out;
  std::ostringstream errors;
  const Complaint complain("trace show", OutputForm::kJson, out, errors);

  complain(ExitStatus::kBadArguments, "say \"x\"\x1B");
  complain(ExitStatus::kNoService, "none", "no-store");

  EXPECT_EQ(errors.str(), "halvoxctl trace show: say \"x\"\\u001b\nhalvoxctl trace show: none\n");
  EXPECT_EQ(out.str(),
            R"({"command":"trace show","result":false,"error":{"kind":"bad-arguments","name":"",)"
            R"("message":"say \"x\"\u001B"}})"
            "\n"
            R"({"command":"trace show","result":false,"error":{"kind":"no-store","name":"",)"
            R"("message":"none"}})"
            "\n");
}

}  // namespace
}  // namespace halvox::tools
