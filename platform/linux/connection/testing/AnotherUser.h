#pragma once

#include <cstdlib>

#include <sys/syscall.h>
#include <unistd.h>

namespace halvox::platform::linux_ {

// While this object exists, the thread that made it, and no other thread, acts as another user:
// neither root nor the user of the test. Connections that the thread makes in that time belong to
// that user even afterwards. Needs the rights of root.
class AnotherUser {
 public:
  static constexpr uid_t kUid = 65534;

  [[nodiscard]] static bool isPossible() { return geteuid() == 0; }

  AnotherUser() { become(kUid); }
  AnotherUser(const AnotherUser&) = delete;
  AnotherUser& operator=(const AnotherUser&) = delete;
  ~AnotherUser() { become(0); }

 private:
  // Use the system call, because the function of the C library would change the user of all
  // threads.
  static void become(uid_t user) {
    constexpr uid_t kSame = static_cast<uid_t>(-1);
    if (syscall(SYS_setresuid, kSame, user, kSame) != 0) std::abort();
  }
};

}  // namespace halvox::platform::linux_
