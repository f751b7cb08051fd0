#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/results_file.h"

namespace halvox::platform::contract {

// The content of a results file.
struct ResultsFileContent {
  std::string product;
  std::uint32_t version = 0;
  // Values by name; the names are in the order of their first values.
  std::vector<std::pair<std::string, std::vector<double>>> values;
  friend bool operator==(const ResultsFileContent&, const ResultsFileContent&) = default;
};

// What every ResultsFileService promises.
//
// `Harness` is default-constructible and has
//   ResultsFileService& service();
//   std::string usable(const std::string& name);  a path at which a file can be created
//   std::string unusable();                       a path at which none can
//   std::optional<ResultsFileContent> read(const std::string& path);  none if there is no such file
template <typename Harness>
class ResultsFileContract : public ::testing::Test {
 protected:
  ResultsFileService::Writer open() {
    return harness_.service().sswriter_open(path_, "Product", 4, 0);
  }
  void add(ResultsFileService::Writer& writer, const char* name, double value) {
    harness_.service().sswriter_new_value(*writer, name, ssunit::ssunit_nanoseconds, value);
  }
  void close(ResultsFileService::Writer writer) {
    harness_.service().sswriter_close(std::move(writer));
  }

  Harness harness_;
  const std::string path_ = harness_.usable("results.ssj");
};
TYPED_TEST_SUITE_P(ResultsFileContract);

TYPED_TEST_P(ResultsFileContract, ClosedFileHoldsProductVersionAndValuesByName) {
  auto writer = this->open();
  ASSERT_NE(writer, nullptr);
  this->add(writer, "second", 2.5);
  this->add(writer, "first", 1);
  this->add(writer, "second", 0.1);
  this->close(std::move(writer));

  EXPECT_EQ(this->harness_.read(this->path_),
            (ResultsFileContent{"Product", 4, {{"second", {2.5, 0.1}}, {"first", {1}}}}));
}

TYPED_TEST_P(ResultsFileContract, FileWithoutValuesIsWhole) {
  this->close(this->open());

  EXPECT_EQ(this->harness_.read(this->path_), (ResultsFileContent{"Product", 4, {}}));
}

TYPED_TEST_P(ResultsFileContract, NobodySeesAFileBeforeItIsClosed) {
  auto writer = this->open();
  this->add(writer, "n", 1);

  EXPECT_EQ(this->harness_.read(this->path_), std::nullopt);
}

TYPED_TEST_P(ResultsFileContract, OldFileStaysUntilTheNewOneIsClosed) {
  auto first = this->open();
  this->add(first, "old", 1);
  this->close(std::move(first));
  auto second = this->open();
  this->add(second, "new", 2);

  EXPECT_EQ(this->harness_.read(this->path_), (ResultsFileContent{"Product", 4, {{"old", {1}}}}));
  this->close(std::move(second));

  EXPECT_EQ(this->harness_.read(this->path_), (ResultsFileContent{"Product", 4, {{"new", {2}}}}));
}

TYPED_TEST_P(ResultsFileContract, WriterThatIsLetGoLeavesTheOldFile) {
  this->close(this->open());
  auto writer = this->open();
  this->add(writer, "n", 1);

  writer.reset();

  EXPECT_EQ(this->harness_.read(this->path_), (ResultsFileContent{"Product", 4, {}}));
}

TYPED_TEST_P(ResultsFileContract, PlaceThatCannotBeUsedGivesNoWriter) {
  const std::string path = this->harness_.unusable();

  EXPECT_EQ(this->harness_.service().sswriter_open(path, "Product", 4, 0), nullptr);
  EXPECT_EQ(this->harness_.read(path), std::nullopt);
}

TYPED_TEST_P(ResultsFileContract, ClosingNoWriterDoesNothing) {
  this->close(nullptr);

  EXPECT_EQ(this->harness_.read(this->path_), std::nullopt);
}

TYPED_TEST_P(ResultsFileContract, FilesThatAreWrittenAtOnceKeepTheirOwnValues) {
  const std::string other = this->harness_.usable("other.ssj");
  auto first = this->open();
  auto second = this->harness_.service().sswriter_open(other, "Other", 5, 0);
  this->add(first, "a", 1);
  this->add(second, "b", 2);
  this->close(std::move(second));
  this->close(std::move(first));

  EXPECT_EQ(this->harness_.read(this->path_), (ResultsFileContent{"Product", 4, {{"a", {1}}}}));
  EXPECT_EQ(this->harness_.read(other), (ResultsFileContent{"Other", 5, {{"b", {2}}}}));
}

REGISTER_TYPED_TEST_SUITE_P(ResultsFileContract, ClosedFileHoldsProductVersionAndValuesByName,
                            FileWithoutValuesIsWhole, NobodySeesAFileBeforeItIsClosed,
                            OldFileStaysUntilTheNewOneIsClosed, WriterThatIsLetGoLeavesTheOldFile,
                            PlaceThatCannotBeUsedGivesNoWriter, ClosingNoWriterDoesNothing,
                            FilesThatAreWrittenAtOnceKeepTheirOwnValues);

}  // namespace halvox::platform::contract
