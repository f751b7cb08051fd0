#include "platform/linux/runtime/ProcfsProcessService.h"

#include <array>
#include <string>

#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

// Gives the test process another name for a scope.
class OwnName {
 public:
  explicit OwnName(const char* name) {
    ::prctl(PR_GET_NAME, old_.data());
    ::prctl(PR_SET_NAME, name);
  }
  ~OwnName() { ::prctl(PR_SET_NAME, old_.data()); }
  OwnName(const OwnName&) = delete;
  OwnName& operator=(const OwnName&) = delete;

 private:
  std::array<char, 16> old_{};
};

std::string recordedOwnName() {
  const auto record = ProcfsProcessService().processRecord(::getpid());
  return record.has_value() ? record->commandName : "(none)";
}

TEST(ProcfsProcessServiceTest, NameMayHoldNewlines) {
  const OwnName name("two\nlines\n");

  EXPECT_EQ(recordedOwnName(), "two\nlines\n");
}

TEST(ProcfsProcessServiceTest, BytesThatAreNoCharactersAreReplaced) {
  // The kernel cuts the name within its last character.
  const OwnName name("fourteen-bytesé");

  EXPECT_EQ(recordedOwnName(), "fourteen-bytes\uFFFD");
}

TEST(ProcfsProcessServiceTest, EmptyNameIsARecord) {
  const OwnName name("");

  EXPECT_EQ(recordedOwnName(), "");
}

TEST(ProcfsProcessServiceTest, OwnNameIsThatOfTheProgramInFull) {
  EXPECT_EQ(ProcfsProcessService().ownProcessName(), "halvox_runtime_test");
  EXPECT_EQ(ProcfsProcessService().ownProcessIdentifier(), ::getpid());
}

TEST(ProcfsProcessServiceTest, TerminateEndsTheProcessWithoutDestructors) {
  struct Teller {
    ~Teller() { ::_exit(99); }
  };

  EXPECT_EXIT(
      {
        const Teller teller;
        ProcfsProcessService().terminate(2);
      },
      ::testing::ExitedWithCode(2), "");
}

}  // namespace
}  // namespace halvox::platform::linux_
