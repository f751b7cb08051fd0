#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/connection.h"
#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// The object that the tests export. There is a method for each way in which a request can be
// treated.
class TestObject final : public ExportedObject {
 public:
  [[nodiscard]] ResourceUse resourceUse() const override {
    return {.bytes = heldBytes.load(), .sessions = sessions.load()};
  }

  // An unanswered request to "busy" stays open, because the object keeps its token. A request to
  // "hold" is carried out at once and answered later.
  void keepBusy(RequestToken token, ReplyCallback reply);
  void holdReply(ReplyCallback reply);
  void answerBusy();
  void answerHeld();

  std::atomic<std::uint64_t> delivered{0};
  std::atomic<std::uint64_t> heldBytes{0};
  std::atomic<std::uint64_t> sessions{0};

 private:
  struct Busy {
    RequestToken token;
    ReplyCallback reply;
  };
  Mutex mutex_;
  std::vector<Busy> busy_ HALVOX_GUARDED_BY(mutex_);
  std::vector<ReplyCallback> held_ HALVOX_GUARDED_BY(mutex_);
};

// The methods:
//   echo s → s        the text again, at once
//   away s → s        the text again, from another thread
//   twice s → s       the text, two times
//   take a{sv}uqaax   nothing
//   fail → b          the error 1 of com.tarno.audio.reporting
//   hold x → b        true, once the test says so; carried out at once
//   busy x → b        true, once the test says so; not carried out before
//   create x → b      true; makes a session
//   grow → b          true; may hold more
//   name ax → b       true; the numbers are reporter IDs
//   list → ax         1000 numbers
//   end → b           true; for the owner only
//   pid → u           the process that asks; 0 for a request without a token
const NSXPCInterface& testInterface();
inline constexpr const char* kTestPath = "/com/tarno/test/object";
inline constexpr const char* kTestInterface = "com.tarno.test.Object";

// Accepts every connection, and exports the same object on all of them.
class TestDelegate final : public NSXPCListenerDelegate {
 public:
  bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<NSXPCConnection>& connection) override;

  // Events of connections, such as "accepted 1234", "interrupted 1234", "invalidated 1234".
  [[nodiscard]] std::vector<std::string> events() const;
  [[nodiscard]] bool hasSeen(const std::string& event) const;

  const std::shared_ptr<TestObject> object = std::make_shared<TestObject>();
  std::atomic<bool> refuses{false};

 private:
  void note(const std::string& event);

  mutable Mutex mutex_;
  std::vector<std::string> events_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
