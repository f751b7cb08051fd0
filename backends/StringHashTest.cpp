#include "backends/StringHash.h"

#include <fstream>

#include <gtest/gtest.h>

#include "backends/testdata/HashedStrings.h"

namespace halvox {
namespace {

TEST(StringHashTest, HashesEqualThoseOfLibcxx) {
  std::ifstream file(HALVOX_BACKENDS_TESTDATA "/string_hashes.txt");
  ASSERT_TRUE(file.is_open());
  file >> std::hex;

  for (std::size_t index = 0; index < kHashedStrings; ++index) {
    std::uint64_t expected = 0;
    ASSERT_TRUE(file >> expected) << index;
    const std::string text = hashedString(index);
    ASSERT_EQ(hashString(text), expected) << "text " << index << " of " << text.size() << " bytes";
  }
  std::string rest;
  EXPECT_FALSE(file >> rest);
}

TEST(StringHashTest, TheHashOfNoBytesIsAConstant) {
  EXPECT_EQ(hashString({}), 0x9ae16a3b2f90404fU);
}

}  // namespace
}  // namespace halvox
