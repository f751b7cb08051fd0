#pragma once

#include <cstdlib>

#include <sys/syscall.h>
#include <unistd.h>

namespace halvox::platform::linux_ {

// While it lives, this thread alone acts as a user who is neither root nor the one of the test, and
// connections that it makes are that user's for good. Needs the rights of root.
class AnotherUser {
 public:
  static constexpr uid_t kUid = 65534;

  [[nodiscard]] static bool isPossible() { return geteuid() == 0; }

  AnotherUser() { become(kUid); }
  AnotherUser(const AnotherUser&) = delete;
  AnotherUser& operator=(const AnotherUser&) = delete;
  ~AnotherUser() { become(0); }

 private:
  // The library's own call changes all threads.
  static void become(uid_t user) {
    constexpr uid_t kSame = static_cast<uid_t>(-1);
    if (syscall(SYS_setresuid, kSame, user, kSame) != 0) std::abort();
  }
};

}  // namespace halvox::platform::linux_
