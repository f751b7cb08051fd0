#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/property_list.h"

namespace halvox::platform::contract {

// What every PropertyListService promises.
//
// `Harness` is default-constructible and has
//   PropertyListService& service();
//   std::string write(const std::string& name, const Value& root);
//     writes a property list with that root to the file of that name, replacing an older one, and
//     returns the path; the root is a tree of dictionaries, arrays, texts, integers, reals and
//     booleans
//   std::string writeBroken(const std::string& name);  writes a file that is not a property list
//   std::string missing();                             the path of a file that does not exist
template <typename Harness>
class PropertyListContract : public ::testing::Test {
 protected:
  std::optional<Value> load(const std::string& path) {
    return harness_.service().parse(harness_.service().readFile(path, error_), error_);
  }

  Harness harness_;
  std::optional<Error> error_;
};
TYPED_TEST_SUITE_P(PropertyListContract);

TYPED_TEST_P(PropertyListContract, RootComesBackAsItWasWritten) {
  const Dictionary root{{"Children", Array{Dictionary{{"Name", "T"}, {"IsCritical", true}}, 7}},
                        {"Real", 0.25},
                        {"Empty", Array{}},
                        {"Negative", -5}};

  const auto read = this->load(this->harness_.write("list", root));

  EXPECT_EQ(read, Value(root));
  EXPECT_FALSE(this->error_.has_value());
}

TYPED_TEST_P(PropertyListContract, RootNeedNotBeADictionary) {
  EXPECT_EQ(this->load(this->harness_.write("text", "alone")), Value("alone"));
  EXPECT_EQ(this->load(this->harness_.write("array", Array{1, 2})), Value(Array{1, 2}));
}

TYPED_TEST_P(PropertyListContract, MissingFileIsAnErrorThatNamesIt) {
  const std::string path = this->harness_.missing();

  EXPECT_FALSE(this->harness_.service().readFile(path, this->error_).has_value());

  ASSERT_TRUE(this->error_.has_value());
  EXPECT_NE(this->error_->description.find(path), std::string::npos) << this->error_->description;
}

TYPED_TEST_P(PropertyListContract, FileThatIsNoPropertyListIsReadButNotParsed) {
  const auto bytes =
      this->harness_.service().readFile(this->harness_.writeBroken("broken"), this->error_);
  EXPECT_TRUE(bytes.has_value());
  EXPECT_FALSE(this->error_.has_value());

  EXPECT_FALSE(this->harness_.service().parse(bytes, this->error_).has_value());
  EXPECT_TRUE(this->error_.has_value());
}

TYPED_TEST_P(PropertyListContract, NoBytesAreAnError) {
  EXPECT_FALSE(this->harness_.service().parse(std::nullopt, this->error_).has_value());
  EXPECT_TRUE(this->error_.has_value());

  this->error_.reset();
  EXPECT_FALSE(
      this->harness_.service().parse(Data(std::span<const std::byte>()), this->error_).has_value());
  EXPECT_TRUE(this->error_.has_value());
}

TYPED_TEST_P(PropertyListContract, BytesStayAsTheyWereRead) {
  const std::string path = this->harness_.write("list", "old");
  const auto bytes = this->harness_.service().readFile(path, this->error_);

  this->harness_.write("list", "new");

  EXPECT_EQ(this->harness_.service().parse(bytes, this->error_), Value("old"));
  EXPECT_EQ(this->load(path), Value("new"));
}

TYPED_TEST_P(PropertyListContract, CurrentDirectoryIsAWholePath) {
  EXPECT_TRUE(this->harness_.service().currentDirectory().starts_with("/"));
}

TYPED_TEST_P(PropertyListContract, SeveralThreadsMayReadAtOnce) {
  const std::string path = this->harness_.write("list", Array{1, 2, 3});
  const PropertyListService& service = this->harness_.service();
  std::vector<std::optional<Value>> read(4);

  std::vector<std::thread> readers;
  readers.reserve(read.size());
  for (auto& result : read) {
    readers.emplace_back([&] {
      std::optional<Error> error;
      result = service.parse(service.readFile(path, error), error);
    });
  }
  for (std::thread& reader : readers) reader.join();

  for (const auto& result : read) EXPECT_EQ(result, Value(Array{1, 2, 3}));
}

REGISTER_TYPED_TEST_SUITE_P(PropertyListContract, RootComesBackAsItWasWritten,
                            RootNeedNotBeADictionary, MissingFileIsAnErrorThatNamesIt,
                            FileThatIsNoPropertyListIsReadButNotParsed, NoBytesAreAnError,
                            BytesStayAsTheyWereRead, CurrentDirectoryIsAWholePath,
                            SeveralThreadsMayReadAtOnce);

}  // namespace halvox::platform::contract
