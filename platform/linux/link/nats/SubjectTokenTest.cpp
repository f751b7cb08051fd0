#include "platform/linux/link/nats/SubjectToken.h"

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(SubjectTokenTest, KeepsOrdinaryNames) {
  EXPECT_EQ(subjectToken("playback_session"), "playback_session");
  EXPECT_EQ(subjectToken("W\xC3\xA4hler-2"), "W\xC3\xA4hler-2");
}

TEST(SubjectTokenTest, ReplacesWhatSubjectsGiveAMeaning) {
  EXPECT_EQ(subjectToken("a.b*c>d"), "a_b_c_d");
  EXPECT_EQ(subjectToken(">"), "_");
}

TEST(SubjectTokenTest, ReplacesBlanksAndControlCharacters) {
  EXPECT_EQ(subjectToken("a b\tc\r\nPUB x"), "a_b_c__PUB_x");
  EXPECT_EQ(subjectToken(std::string_view("a\0b\x7F", 4)), "a_b_");
}

TEST(SubjectTokenTest, NeverIsEmpty) { EXPECT_EQ(subjectToken(""), "_"); }

TEST(SubjectTokenTest, CutsALongNameBetweenCharacters) {
  std::string name(kLongestSubjectToken - 1, 'a');
  name += "\xC3\xA4" + std::string(5000, 'b');

  EXPECT_EQ(subjectToken(name), std::string(kLongestSubjectToken - 1, 'a'));
}

TEST(SubjectTokenTest, CutsBytesThatAreNoCharactersToNothingWorse) {
  EXPECT_EQ(subjectToken(std::string(5000, '\x80')), "_");
}

}  // namespace
}  // namespace halvox::platform::linux_
