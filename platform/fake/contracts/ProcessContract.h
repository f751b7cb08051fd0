#pragma once

#include <limits>
#include <optional>

#include <gtest/gtest.h>

#include "platform/process.h"

namespace halvox::platform::contract {

// What every ProcessService promises.
//
// `Harness` is default-constructible and has
//   ProcessService& service();
//   ProcessID startProcess(const std::string& commandName);  starts a process with that name
//   void renameProcess(ProcessID pid, const std::string& commandName);  lets it rename itself
//   void endProcess(ProcessID pid);  ends it; afterwards there is no such process
//   int exitStatusOf(int status);
//     the exit status of a process that calls terminate(status), perhaps of a copy of this one; -1
//     if the call returned
template <typename Harness>
class ProcessContract : public ::testing::Test {
 protected:
  Harness harness_;
};
TYPED_TEST_SUITE_P(ProcessContract);

TYPED_TEST_P(ProcessContract, RecordNamesTheRunningProcess) {
  const ProcessID pid = this->harness_.startProcess("player");

  const std::optional<ProcessRecord> record = this->harness_.service().processRecord(pid);

  this->harness_.endProcess(pid);
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->pid, pid);
  EXPECT_EQ(record->commandName, "player");
}

TYPED_TEST_P(ProcessContract, NameMayHoldBlanksAndParentheses) {
  const ProcessID pid = this->harness_.startProcess("a) S (b 1");

  const std::optional<ProcessRecord> record = this->harness_.service().processRecord(pid);

  this->harness_.endProcess(pid);
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->commandName, "a) S (b 1");
}

TYPED_TEST_P(ProcessContract, LongNameIsCutTo15Bytes) {
  const ProcessID pid = this->harness_.startProcess("a-rather-long-program-name");

  const std::optional<ProcessRecord> record = this->harness_.service().processRecord(pid);

  this->harness_.endProcess(pid);
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->commandName, "a-rather-long-p");
}

TYPED_TEST_P(ProcessContract, ProcessThatRenamesItselfHasItsNewNameAtOnce) {
  const ProcessID pid = this->harness_.startProcess("player");
  EXPECT_EQ(this->harness_.service().processRecord(pid)->commandName, "player");

  this->harness_.renameProcess(pid, "recorder");
  const std::optional<ProcessRecord> record = this->harness_.service().processRecord(pid);

  this->harness_.endProcess(pid);
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->commandName, "recorder");
}

TYPED_TEST_P(ProcessContract, BytesOfANameThatAreNoTextAreReplaced) {
  const ProcessID pid = this->harness_.startProcess("a\xFFz");

  const std::optional<ProcessRecord> record = this->harness_.service().processRecord(pid);

  this->harness_.endProcess(pid);
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->commandName, "a\xEF\xBF\xBDz");
}

TYPED_TEST_P(ProcessContract, TerminationEndsTheProcessWithItsStatusAndReturnsNever) {
  EXPECT_EQ(this->harness_.exitStatusOf(2), 2);
  EXPECT_EQ(this->harness_.exitStatusOf(0), 0);
}

TYPED_TEST_P(ProcessContract, VanishedProcessHasNoRecord) {
  const ProcessID pid = this->harness_.startProcess("player");
  this->harness_.endProcess(pid);

  EXPECT_FALSE(this->harness_.service().processRecord(pid).has_value());
}

TYPED_TEST_P(ProcessContract, NumbersThatAreNoProcessHaveNoRecord) {
  ProcessService& service = this->harness_.service();

  EXPECT_FALSE(service.processRecord(0).has_value());
  EXPECT_FALSE(service.processRecord(-1).has_value());
  EXPECT_FALSE(service.processRecord(std::numeric_limits<ProcessID>::min()).has_value());
  EXPECT_FALSE(service.processRecord(std::numeric_limits<ProcessID>::max()).has_value());
}

TYPED_TEST_P(ProcessContract, OwnProcessHasANumberAndAName) {
  EXPECT_GT(this->harness_.service().ownProcessIdentifier(), 0);
  EXPECT_FALSE(this->harness_.service().ownProcessName().empty());
}

REGISTER_TYPED_TEST_SUITE_P(ProcessContract, RecordNamesTheRunningProcess,
                            NameMayHoldBlanksAndParentheses, LongNameIsCutTo15Bytes,
                            ProcessThatRenamesItselfHasItsNewNameAtOnce,
                            BytesOfANameThatAreNoTextAreReplaced,
                            TerminationEndsTheProcessWithItsStatusAndReturnsNever,
                            VanishedProcessHasNoRecord, NumbersThatAreNoProcessHaveNoRecord,
                            OwnProcessHasANumberAndAName);

}  // namespace halvox::platform::contract
