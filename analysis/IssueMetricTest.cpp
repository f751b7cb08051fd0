#include "analysis/IssueMetric.h"

#include <string>

#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

TEST(IssueMetricTest, AnIssueHasTypeNodeAndClient) {
  // Time stamp 1, duration 2, then three texts and a field of a later version.
  const std::string bytes("\x08\x01\x10\x02\x1a\x04xrun\x22\x04node\x2a\x06player\x30\x05", 26);

  const auto issue = parseAudioIssue(bytes);

  ASSERT_TRUE(issue.has_value());
  EXPECT_EQ(issue->type, "xrun");
  EXPECT_EQ(issue->node, "node");
  EXPECT_EQ(issue->client, "player");
}

TEST(IssueMetricTest, AbsentTextsAreEmpty) {
  const auto issue = parseAudioIssue("");

  ASSERT_TRUE(issue.has_value());
  EXPECT_EQ(issue->type, "");
}

TEST(IssueMetricTest, DamagedBytesAreNotAnIssue) {
  EXPECT_FALSE(parseAudioIssue("\x1a\x7f").has_value());
  EXPECT_FALSE(parseAudioIssue(std::string("\x1a\x04xr", 4)).has_value());
}

}  // namespace
}  // namespace halvox::analysis
