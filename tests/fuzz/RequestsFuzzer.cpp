// Plays several clients of the service, which send any request with any arguments, in any order,
// and come and go. The bytes are a list of steps:
//
//   one byte   bits 0 and 1: the client; bits 2 to 7: what it does
//   a request  two bytes with the length of the arguments, then the arguments as on the wire
//
// Whatever the clients do, each request has at most one answer, and nothing of the clients is left
// when all have gone. A run ends when a client ends the service.

#include <algorithm>
#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

#include "backends/HVReportingUtility.h"
#include "platform/fake/FakePlatform.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "service/HVReportingServiceDelegate.h"
#include "service/HVReportingServiceProtocol.h"
#include "tests/fuzz/InputBytes.h"
#include "tests/fuzz/InputFile.h"

namespace halvox {
namespace {

using fuzzing::require;
using platform::Value;

class Bytes : public fuzzing::InputBytes {
 public:
  using InputBytes::InputBytes;

  std::span<const std::byte> block() {
    const std::size_t length = byte() | std::size_t{byte()} << 8U;
    return std::as_bytes(take(length));
  }
};

// Sessions have few numbers, so that the requests of a run are about the same ones.
void useFewNumbers(std::vector<Value>& arguments) {
  if (arguments.empty() || arguments.back().kind() != platform::ValueKind::kNumber) return;
  arguments.back() = Value(arguments.back().toInt64() & 7);
}

class Service {
 public:
  Service() { platform_.connections.serviceListener().setDelegate(*delegate_); }

  void step(Bytes& bytes) {
    const std::uint8_t first = bytes.byte();
    const std::size_t client = first & 3U;
    const std::size_t action = first >> 2U;
    const auto methods = HVReportingServiceInterface().methods;
    if (action < methods.size()) {
      request(client, methods[action], bytes.block());
    } else if (action == methods.size()) {
      disconnect(client);
    } else if (action == methods.size() + 1) {
      platform_.dispatch.runUntilIdle();
    } else {
      platform_.dispatch.runOne();
    }
  }

  void end() {
    for (std::size_t client = 0; client < clients_.size(); ++client) disconnect(client);
    platform_.dispatch.runUntilIdle();
    require(delegate_->getAllClients().empty());
    require(delegate_->getAllActiveReportingSessions().empty());
    for (const auto& call : calls_) require(call->replies().size() <= 1);
    clear();
  }

  // The jobs that wait refer to the service.
  void clear() { platform_.dispatch.clear(); }

 private:
  void request(std::size_t client, const platform::InterfaceMethod& method,
               std::span<const std::byte> body) {
    platform::linux_::dbus::Frame frame;
    frame.header.signature = method.in;
    frame.body = body;
    std::vector<Value> arguments;
    if (platform::linux_::dbus::decodeBody(frame, method.in, arguments).has_value()) return;
    useFewNumbers(arguments);
    if (clients_[client] == nullptr) connect(client);
    calls_.push_back(clients_[client]->call(method.name, std::move(arguments)));
  }

  void connect(std::size_t client) {
    const auto pid = static_cast<platform::ProcessID>(100 + client);
    platform_.process.addProcess(pid, "player");
    clients_[client] = platform_.connections.connect(pid);
  }

  void disconnect(std::size_t client) {
    if (clients_[client] == nullptr) return;
    clients_[client]->invalidate();
    clients_[client].reset();
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingServiceDelegate> delegate_ =
      std::make_shared<HVReportingServiceDelegate>();
  std::array<std::shared_ptr<platform::FakeConnection>, 4> clients_;
  std::vector<std::shared_ptr<platform::FakeCall>> calls_;
};

// The process asks only once.
bool beInternalBuild() {
  platform::FakePlatform fakes;
  fakes.deviceProperties.set("InternalBuild", true);
  return HVReportingUtilityIsInternalBuild();
}

}  // namespace
}  // namespace halvox

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const bool isInternal = halvox::beInternalBuild();
  halvox::fuzzing::require(isInternal);
  halvox::Service service;
  halvox::Bytes bytes({data, size});
  try {
    while (!bytes.isEmpty()) service.step(bytes);
    service.end();
  } catch (const halvox::platform::FakeTermination&) {
    service.clear();
  }
  return 0;
}
