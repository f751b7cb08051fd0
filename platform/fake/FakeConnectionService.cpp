#include "platform/fake/FakeConnectionService.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace halvox::platform {
namespace {

// Skips one complete type of a D-Bus signature. Returns the position after it.
std::size_t skipType(std::string_view signature, std::size_t position) {
  if (signature.at(position) == 'a') return skipType(signature, position + 1);
  int depth = 0;
  do {
    const char symbol = signature.at(position++);
    if (symbol == '(' || symbol == '{') ++depth;
    if (symbol == ')' || symbol == '}') --depth;
  } while (depth > 0);
  return position;
}

std::size_t countTypes(std::string_view signature) {
  std::size_t count = 0;
  for (std::size_t at = 0; at < signature.size(); at = skipType(signature, at)) ++count;
  return count;
}

const InterfaceMethod& methodNamed(const NSXPCInterface& interface, std::string_view name) {
  const auto method = std::ranges::find(interface.methods, name, &InterfaceMethod::name);
  if (method == interface.methods.end()) {
    throw std::invalid_argument("the exported interface has no method " + std::string(name));
  }
  return *method;
}

// Collects the answers of a posted request. Holds a copy of `openRequests` until the request has
// been carried out.
class PostedCall final : public RequestSource {
 public:
  PostedCall(std::shared_ptr<FakeCall> call, std::shared_ptr<int> openRequests)
      : call_(std::move(call)), openRequests_(std::move(openRequests)) {}

  void answer(const RequestMark& /*mark*/, const std::optional<Error>& error,
              const Value& value) override {
    call_->add(error, value);
  }
  void carriedOut(const RequestMark& /*mark*/) override { openRequests_.reset(); }

 private:
  const std::shared_ptr<FakeCall> call_;
  std::shared_ptr<int> openRequests_;
};

}  // namespace

std::vector<FakeCall::Reply> FakeCall::replies() const {
  const std::lock_guard lock(mutex_);
  return replies_;
}

Value FakeCall::value() const {
  const std::vector<Reply> all = replies();
  if (all.size() != 1 || all.front().error.has_value()) {
    throw std::logic_error("expected exactly one answer of " + method_ + ", without an error");
  }
  return all.front().value;
}

void FakeCall::add(const std::optional<Error>& error, const Value& value) {
  journal_.record(JournalKind::kReply, method_);
  const std::lock_guard lock(mutex_);
  replies_.push_back({error, value});
}

std::shared_ptr<FakeCall> FakeConnection::call(std::string_view method,
                                               std::vector<Value> arguments) {
  if (!resumed_ || ended_ || interface_ == nullptr || object_ == nullptr) {
    throw std::logic_error("request on a connection that was not resumed or has ended");
  }
  const InterfaceMethod& target = methodNamed(*interface_, method);
  if (countTypes(target.in) != arguments.size()) {
    throw std::invalid_argument("wrong number of arguments for " + std::string(method));
  }
  auto call = std::make_shared<FakeCall>(journal_, std::string(method));
  if (target.access == MethodAccess::kOwner && user_ == FakeUser::kStranger) {
    call->add(Error{.description = std::string(method) + " is for the service's owner",
                    .name = "org.freedesktop.DBus.Error.AccessDenied"},
              Value());
    return call;
  }
  const std::shared_ptr<ExportedObject> object = object_;  // a request may end the connection
  if (target.reporterIDs != nullptr && target.reporterIDs(arguments) > kMaxReporterIDs) {
    call->add(Error{.description = "message_reporter_ids = " + std::to_string(kMaxReporterIDs) +
                                   " is exceeded",
                    .name = "org.freedesktop.DBus.Error.LimitsExceeded"},
              Value());
    return call;
  }
  if (target.post != nullptr) {
    target.post(*object, arguments,
                PostedRequest(std::make_shared<PostedCall>(call, openRequests_),
                              {.wantsAnswer = true, .signature = target.out}),
                pid_);
    object->endOfRequests();
    return call;
  }
  target.invoke(*object,
                {.arguments = arguments,
                 .reply = [call](const std::optional<Error>& error,
                                 const Value& value) { call->add(error, value); },
                 .context = {.sender = pid_,
                             .token = std::make_shared<std::shared_ptr<int>>(openRequests_)}});
  return call;
}

void FakeConnection::interrupt() {
  if (!ended_ && interruptionHandler_) interruptionHandler_();
}

void FakeConnection::invalidate() {
  if (std::exchange(ended_, true)) return;
  if (invalidationHandler_) invalidationHandler_();
  abandon();
}

void FakeConnection::abandon() {
  ended_ = true;
  interruptionHandler_ = nullptr;
  invalidationHandler_ = nullptr;
  object_.reset();
}

std::size_t FakeConnection::openRequests() const {
  return static_cast<std::size_t>(openRequests_.use_count()) - 1;
}

std::string FakeConnection::description() const {
  return "<FakeConnection pid " + std::to_string(pid_) + ">";
}

void FakeConnection::setExportedObject(std::shared_ptr<ExportedObject> object) {
  object_ = std::move(object);
}

void FakeConnection::setInterruptionHandler(std::function<void()> handler) {
  interruptionHandler_ = std::move(handler);
}

void FakeConnection::setInvalidationHandler(std::function<void()> handler) {
  invalidationHandler_ = std::move(handler);
}

std::shared_ptr<FakeConnection> FakeConnectionService::connect(ProcessID pid, FakeUser user) {
  if (listener_.delegate() == nullptr) throw std::logic_error("the listener has no delegate");
  auto connection = std::make_shared<FakeConnection>(journal_, pid, user);
  connections_.push_back(connection);
  connection->accepted_ = listener_.delegate()->listenerShouldAcceptNewConnection(connection);
  if (!connection->accepted_) connection->abandon();
  return connection;
}

void FakeConnectionService::clear() {
  for (const std::shared_ptr<FakeConnection>& connection : connections_) connection->abandon();
  connections_.clear();
}

}  // namespace halvox::platform
