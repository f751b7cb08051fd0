#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "platform/files.h"

namespace halvox::platform::contract {

// What every FileService promises. `Harness` has
//   FileService& service();
//   std::vector<std::string> names(const std::string& directory);  // of its files, in any order
//   std::vector<std::string> keys(const std::string& directory, const std::string& name);
//     // of the objects in the file's array, in order
template <typename Harness>
class FileContract : public ::testing::Test {
 protected:
  static constexpr const char* kDirectory = "/var/summaries";
  static constexpr std::uint32_t kPermissions = 0755;

  FileService& service() { return harness_.service(); }
  void makeDirectory() {
    ASSERT_EQ(service().createDirectory(kDirectory, kPermissions), std::nullopt);
  }
  std::unique_ptr<JsonArrayFile> begin(std::string_view name) {
    return service().createJsonArrayFile(kDirectory, name);
  }

  Harness harness_;
};
TYPED_TEST_SUITE_P(FileContract);

TYPED_TEST_P(FileContract, CommittedFileHasItsObjectsInTheirOrder) {
  this->makeDirectory();
  const auto file = this->begin("a.json");
  for (const char* key : {"second", "first", "second"}) {
    file->appendObject(key, Dictionary{{"n", 1}});
  }
  std::string path;

  EXPECT_EQ(file->commit(path), std::nullopt);

  EXPECT_TRUE(path.ends_with("/var/summaries/a.json")) << path;
  EXPECT_EQ(this->harness_.names(this->kDirectory), std::vector<std::string>{"a.json"});
  EXPECT_EQ(this->harness_.keys(this->kDirectory, "a.json"),
            (std::vector<std::string>{"second", "first", "second"}));
}

TYPED_TEST_P(FileContract, FileHasNoNameBeforeItIsCommitted) {
  this->makeDirectory();
  const auto file = this->begin("a.json");
  file->appendObject("key", Dictionary{{"n", 1}});

  EXPECT_TRUE(this->harness_.names(this->kDirectory).empty());
}

TYPED_TEST_P(FileContract, FileThatIsLetGoLeavesNothing) {
  this->makeDirectory();

  this->begin("a.json")->appendObject("key", Dictionary{{"n", 1}});

  EXPECT_TRUE(this->harness_.names(this->kDirectory).empty());
}

TYPED_TEST_P(FileContract, DirectoryThatExistsIsFine) {
  this->makeDirectory();
  this->makeDirectory();

  EXPECT_EQ(this->service().createDirectory("/var", this->kPermissions), std::nullopt);
}

TYPED_TEST_P(FileContract, DirectoryIsMadeWithItsParents) {
  this->makeDirectory();
  std::string path;

  EXPECT_EQ(this->service().createJsonArrayFile("/var", "a.json")->commit(path), std::nullopt);
}

TYPED_TEST_P(FileContract, FileInADirectoryThatIsMissingFailsWhenItIsCommitted) {
  const auto file = this->begin("a.json");
  ASSERT_NE(file, nullptr);
  file->appendObject("key", Dictionary{{"n", 1}});
  std::string path = "as it was";

  const auto error = file->commit(path);

  ASSERT_TRUE(error.has_value());
  EXPECT_FALSE(error->description.empty());
  EXPECT_EQ(path, "as it was");
}

TYPED_TEST_P(FileContract, NameThatNoFileCanHaveFailsWhenItIsCommitted) {
  this->makeDirectory();

  for (const std::string& name :
       {std::string(), std::string("."), std::string(".."), std::string("a/b"),
        std::string("a\0b", 3), std::string(300, 'a')}) {
    const auto file = this->begin(name);
    ASSERT_NE(file, nullptr);
    std::string path;
    EXPECT_TRUE(file->commit(path).has_value()) << name;
  }
  EXPECT_TRUE(this->harness_.names(this->kDirectory).empty());
}

TYPED_TEST_P(FileContract, LaterFileOfTheSameNameTakesThePlaceOfTheEarlier) {
  this->makeDirectory();
  for (const char* key : {"earlier", "later"}) {
    const auto file = this->begin("a.json");
    file->appendObject(key, Dictionary{{"n", 1}});
    std::string path;
    ASSERT_EQ(file->commit(path), std::nullopt);
  }

  EXPECT_EQ(this->harness_.names(this->kDirectory), std::vector<std::string>{"a.json"});
  EXPECT_EQ(this->harness_.keys(this->kDirectory, "a.json"), std::vector<std::string>{"later"});
}

REGISTER_TYPED_TEST_SUITE_P(FileContract, CommittedFileHasItsObjectsInTheirOrder,
                            FileHasNoNameBeforeItIsCommitted, FileThatIsLetGoLeavesNothing,
                            DirectoryThatExistsIsFine, DirectoryIsMadeWithItsParents,
                            FileInADirectoryThatIsMissingFailsWhenItIsCommitted,
                            NameThatNoFileCanHaveFailsWhenItIsCommitted,
                            LaterFileOfTheSameNameTakesThePlaceOfTheEarlier);

}  // namespace halvox::platform::contract
