#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/connection.h"
#include "platform/fake/Journal.h"

namespace halvox::platform {

// One request of a fake client and its answers. Shared by the test and the reply callback; any
// thread may answer. A real connection sends only the first answer. This class keeps all of them,
// so that a test can count them.
class FakeCall {
 public:
  struct Reply {
    std::optional<Error> error;
    Value value;
    friend bool operator==(const Reply&, const Reply&) = default;
  };

  FakeCall(Journal& journal, std::string method) : journal_(journal), method_(std::move(method)) {}

  [[nodiscard]] std::vector<Reply> replies() const;
  [[nodiscard]] bool isAnswered() const { return !replies().empty(); }
  // The value of the only answer. Throws if there is none, more than one, or an error.
  [[nodiscard]] Value value() const;
  void add(const std::optional<Error>& error, const Value& value);

 private:
  Journal& journal_;
  const std::string method_;
  mutable std::mutex mutex_;
  std::vector<Reply> replies_;
};

class FakeConnectionService;

// The user of a fake client's process. kOwner is root or the service's own user, kStranger any
// other.
enum class FakeUser : unsigned char { kOwner, kStranger };

// A client's connection that the test controls: the test sends requests, interrupts and
// disconnects. Everything runs on the test's thread, which stands for the connection's thread.
// Shared by the test and, until it is invalidated, by the service.
class FakeConnection final : public NSXPCConnection {
 public:
  static constexpr std::size_t kMaxReporterIDs = 10'000;  // for one request; the default limit

  FakeConnection(Journal& journal, ProcessID pid, FakeUser user = FakeUser::kOwner)
      : journal_(journal), pid_(pid), user_(user) {}

  // Delivers a request to the exported object. Returns the call with the answers so far; later
  // answers are added to it. Answers with an error if a stranger calls a method for the owner.
  // Throws if the connection was not resumed or has ended, if the object has no such method, or if
  // the number of arguments is not that of the method's signature.
  std::shared_ptr<FakeCall> call(std::string_view method, std::vector<Value> arguments = {});
  // Calls the interruption handler, as if the other end had disconnected and might come back.
  void interrupt();
  // Ends the connection: calls the invalidation handler once, then releases the exported object.
  void invalidate();

  // The number of requests that have not been carried out.
  [[nodiscard]] std::size_t openRequests() const;
  [[nodiscard]] bool isResumed() const { return resumed_; }
  [[nodiscard]] bool isAccepted() const { return accepted_; }
  [[nodiscard]] const NSXPCInterface* exportedInterface() const { return interface_; }
  [[nodiscard]] const std::shared_ptr<ExportedObject>& exportedObject() const { return object_; }

  [[nodiscard]] ProcessID processIdentifier() const override { return pid_; }
  [[nodiscard]] std::string description() const override;
  void setExportedInterface(const NSXPCInterface& interface) override { interface_ = &interface; }
  void setExportedObject(std::shared_ptr<ExportedObject> object) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void resume() override { resumed_ = true; }

 private:
  friend class FakeConnectionService;

  // Releases everything without calling a handler.
  void abandon();

  Journal& journal_;
  const ProcessID pid_;
  const FakeUser user_;
  bool accepted_ = false;
  bool resumed_ = false;
  bool ended_ = false;
  const NSXPCInterface* interface_ = nullptr;
  std::shared_ptr<ExportedObject> object_;
  std::function<void()> interruptionHandler_;
  std::function<void()> invalidationHandler_;
  std::shared_ptr<int> openRequests_ = std::make_shared<int>();  // each open request holds a copy
};

// A listener whose connections the test makes.
class FakeListener final : public NSXPCListener {
 public:
  [[nodiscard]] NSXPCListenerDelegate* delegate() const { return delegate_; }
  [[nodiscard]] bool isResumed() const { return resumed_; }

  void setDelegate(NSXPCListenerDelegate& delegate) override { delegate_ = &delegate; }
  // Returns at once, unlike a real listener, which serves until the process ends.
  void resume() override { resumed_ = true; }

 private:
  NSXPCListenerDelegate* delegate_ = nullptr;
  bool resumed_ = false;
};

// Connections that the test makes. FakePlatform owns it; used on the test's thread.
class FakeConnectionService final : public ConnectionService {
 public:
  // Does not own the journal, which must outlive it.
  explicit FakeConnectionService(Journal& journal) : journal_(journal) {}

  // Connects a new client of that process: passes the connection to the listener's delegate and
  // returns it, accepted or not. A connection that was not accepted has ended. Throws if the
  // listener has no delegate.
  std::shared_ptr<FakeConnection> connect(ProcessID pid, FakeUser user = FakeUser::kOwner);
  // Releases all connections without calling their handlers.
  void clear();

  [[nodiscard]] FakeListener& serviceListener() override { return listener_; }

 private:
  Journal& journal_;
  FakeListener listener_;
  std::vector<std::shared_ptr<FakeConnection>> connections_;
};

}  // namespace halvox::platform
