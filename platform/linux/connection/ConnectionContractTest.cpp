// Tests the contract of connections on the adapter with its own socket.

#include "platform/fake/contracts/ConnectionContract.h"

#include <deque>
#include <filesystem>
#include <functional>

#include "platform/linux/connection/testing/AnotherUser.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::contract {
namespace {

using linux_::AnotherUser;
using linux_::BusClient;
using linux_::BusMessage;
using linux_::ConnectionOptions;
using linux_::LinuxConnectionService;

// A client that uses the systemd library.
class LinuxClient {
 public:
  // A client that the service refuses has no connection.
  explicit LinuxClient(const std::string& address) {
    try {
      client_ = std::make_unique<BusClient>(address);
    } catch (const std::runtime_error&) {
      client_.reset();
    }
  }

  [[nodiscard]] ProcessID process() const { return getpid(); }
  void post(const std::string& method, const std::string& text) {
    BusMessage call;
    sd_bus_message_new_method_call(client_->get(), call.out(), nullptr,
                                   std::string(contractInterface().objectPath).c_str(),
                                   std::string(contractInterface().name).c_str(), method.c_str());
    sd_bus_message_append(call.get(), "s", text.c_str());
    pending_.push_back(std::make_unique<std::optional<ContractAnswer>>());
    sd_bus_call_async(client_->get(), nullptr, call.get(), takeAnswer, pending_.back().get(), 0);
    sd_bus_flush(client_->get());
  }
  std::optional<ContractAnswer> answer() {
    constexpr std::uint64_t kSliceMicroseconds = 10'000;
    const auto hasAnswer = [this] { return pending_.front()->has_value(); };
    const auto awaitAnswer = [this] {
      if (sd_bus_process(client_->get(), nullptr) == 0) {
        sd_bus_wait(client_->get(), kSliceMicroseconds);
      }
    };
    static_cast<void>(linux_::eventually(hasAnswer, awaitAnswer));  // the caller sees the failure
    const std::optional<ContractAnswer> answer = *pending_.front();
    pending_.pop_front();
    return answer;
  }
  void leave() { client_.reset(); }

 private:
  static int takeAnswer(sd_bus_message* message, void* place, sd_bus_error* /*error*/) {
    auto& answer = *static_cast<std::optional<ContractAnswer>*>(place);
    if (const sd_bus_error* error = sd_bus_message_get_error(message); error != nullptr) {
      answer = ContractAnswer{{}, error->name};
      return 0;
    }
    const char* text = "";
    sd_bus_message_read(message, "s", &text);
    answer = ContractAnswer{text, {}};
    return 0;
  }

  std::deque<std::unique_ptr<std::optional<ContractAnswer>>> pending_;
  std::unique_ptr<BusClient> client_;
};

// A service that runs on a thread of its own.
class LinuxHarness {
 public:
  using Client = LinuxClient;

  LinuxHarness() {
    ConnectionOptions options;
    options.socket = directory_.path() / "s";
    options.signals = linux_::EndSignals::kLeaveAlone;
    service_.emplace(std::move(options), backpressure_);
    std::filesystem::permissions(directory_.path(), std::filesystem::perms(0755));
  }
  ~LinuxHarness() { end(); }
  LinuxHarness(const LinuxHarness&) = delete;
  LinuxHarness& operator=(const LinuxHarness&) = delete;

  void serve(NSXPCListenerDelegate& delegate) {
    if (const auto opened = service_->open(); !opened) {
      throw std::runtime_error(opened.error().message);
    }
    service_->serviceListener().setDelegate(delegate);
    thread_ = std::thread([this] { service_->serviceListener().resume(); });
  }
  void end() {
    if (!thread_.joinable()) return;
    service_->requestStop();
    thread_.join();
  }
  [[nodiscard]] bool canBe(ContractUser user) const {
    return user == ContractUser::kOwner || AnotherUser::isPossible();
  }
  Client connect(ContractUser user) {
    std::optional<AnotherUser> other;
    if (user == ContractUser::kStranger) other.emplace();
    return Client("unix:path=" + (directory_.path() / "s").string());
  }
  bool letHappen(const std::function<bool()>& condition) { return linux_::eventually(condition); }

 private:
  FakePlatform platform_;
  linux_::Backpressure backpressure_;
  linux_::ScratchDirectory directory_;
  std::optional<LinuxConnectionService> service_;
  std::thread thread_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Socket, ConnectionContract, LinuxHarness);

}  // namespace halvox::platform::contract
