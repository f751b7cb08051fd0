#include "platform/linux/connection/testing/TestInterface.h"

#include <algorithm>
#include <array>
#include <numeric>
#include <optional>
#include <thread>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

TestObject& objectOf(ExportedObject& object) {
  auto& test = static_cast<TestObject&>(object);
  ++test.delivered;
  return test;
}

void echo(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  invocation.reply(std::nullopt, invocation.arguments[0]);
}

void away(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  std::jthread([reply = std::move(invocation.reply), text = invocation.arguments[0]] {
    reply(std::nullopt, text);
  }).join();
}

void twice(ExportedObject& object, Invocation&& invocation) {
  echo(object, Invocation(invocation));
  invocation.reply(std::nullopt, "again");
}

void take(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  invocation.reply(std::nullopt, Value());
}

void fail(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  invocation.reply(
      Error{.domain = "com.tarno.audio.reporting", .code = 1, .description = "disabled"}, Value());
}

void hold(ExportedObject& object, Invocation&& invocation) {
  objectOf(object).holdReply(std::move(invocation.reply));
}

void busy(ExportedObject& object, Invocation&& invocation) {
  objectOf(object).keepBusy(std::move(invocation.context.token), std::move(invocation.reply));
}

void answerTrue(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  invocation.reply(std::nullopt, true);
}

std::size_t countNumbers(std::span<const Value> arguments) { return arguments[0].array().size(); }

void list(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  constexpr int kCount = 1000;
  std::vector<Value> numbers;
  numbers.reserve(kCount);
  for (int number = 0; number < kCount; ++number) numbers.emplace_back(number);
  invocation.reply(std::nullopt, Array(numbers));
}

void pid(ExportedObject& object, Invocation&& invocation) {
  objectOf(object);
  const RequestContext& context = invocation.context;
  invocation.reply(std::nullopt, context.token != nullptr ? context.sender : 0);
}

constexpr MethodEffect kMore = MethodEffect::kMayHoldMore;
constexpr MethodEffect kNoMore = MethodEffect::kHoldsNoMore;
constexpr std::array kMethods = {
    InterfaceMethod{"echo", "s", "s", kNoMore, echo},
    InterfaceMethod{"away", "s", "s", kNoMore, away},
    InterfaceMethod{"twice", "s", "s", kNoMore, twice},
    InterfaceMethod{"take", "a{sv}uqaax", "", kNoMore, take},
    InterfaceMethod{"fail", "", "b", kNoMore, fail},
    InterfaceMethod{"hold", "x", "b", kNoMore, hold},
    InterfaceMethod{"busy", "x", "b", kNoMore, busy},
    InterfaceMethod{"create", "x", "b", MethodEffect::kMakesSession, answerTrue},
    InterfaceMethod{"grow", "", "b", kMore, answerTrue},
    InterfaceMethod{"name", "ax", "b", kNoMore, answerTrue, countNumbers},
    InterfaceMethod{"list", "", "ax", kNoMore, list},
    InterfaceMethod{"pid", "", "u", kNoMore, pid},
    InterfaceMethod{"end", "", "b", kNoMore, answerTrue, nullptr, MethodAccess::kOwner},
};
constexpr NSXPCInterface kInterface{
    .name = kTestInterface, .objectPath = kTestPath, .methods = kMethods};

}  // namespace

void TestObject::keepBusy(RequestToken token, ReplyCallback reply) {
  const MutexLock lock(mutex_);
  busy_.push_back({.token = std::move(token), .reply = std::move(reply)});
}

void TestObject::holdReply(ReplyCallback reply) {
  const MutexLock lock(mutex_);
  held_.push_back(std::move(reply));
}

void TestObject::answerBusy() {
  std::vector<Busy> busy;
  {
    const MutexLock lock(mutex_);
    std::swap(busy, busy_);
  }
  for (const Busy& request : busy) request.reply(std::nullopt, true);
}

void TestObject::answerHeld() {
  std::vector<ReplyCallback> held;
  {
    const MutexLock lock(mutex_);
    std::swap(held, held_);
  }
  for (const ReplyCallback& reply : held) reply(std::nullopt, true);
}

const NSXPCInterface& testInterface() { return kInterface; }

bool TestDelegate::listenerShouldAcceptNewConnection(
    const std::shared_ptr<NSXPCConnection>& connection) {
  if (refuses) return false;
  const std::string who = std::to_string(connection->processIdentifier());
  note("accepted " + who);
  connection->setExportedInterface(testInterface());
  connection->setExportedObject(object);
  connection->setInterruptionHandler([this, who] { note("interrupted " + who); });
  connection->setInvalidationHandler([this, who] { note("invalidated " + who); });
  connection->resume();
  return true;
}

std::vector<std::string> TestDelegate::events() const {
  const MutexLock lock(mutex_);
  return events_;
}

bool TestDelegate::hasSeen(const std::string& event) const {
  const MutexLock lock(mutex_);
  return std::find(events_.begin(), events_.end(), event) != events_.end();
}

void TestDelegate::note(const std::string& event) {
  const MutexLock lock(mutex_);
  events_.push_back(event);
}

}  // namespace halvox::platform::linux_
