// The contract of connections, run on the fake.

#include "platform/fake/contracts/ConnectionContract.h"

#include <deque>
#include <functional>

#include "platform/fake/FakeConnectionService.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  class Client {
   public:
    explicit Client(std::shared_ptr<FakeConnection> connection)
        : connection_(std::move(connection)) {}

    [[nodiscard]] ProcessID process() const { return connection_->processIdentifier(); }
    void post(const std::string& method, const std::string& text) {
      calls_.push_back(connection_->call(method, {text}));
    }
    std::optional<ContractAnswer> answer() {
      const auto call = calls_.front();
      calls_.pop_front();
      if (!call->isAnswered()) return std::nullopt;
      const FakeCall::Reply reply = call->replies().front();
      if (reply.error.has_value()) return ContractAnswer{{}, reply.error->name};
      return ContractAnswer{std::string(reply.value.string()), {}};
    }
    void leave() {
      connection_->interrupt();
      connection_->invalidate();
    }

   private:
    std::shared_ptr<FakeConnection> connection_;
    std::deque<std::shared_ptr<FakeCall>> calls_;
  };

  void serve(NSXPCListenerDelegate& delegate) { service_.serviceListener().setDelegate(delegate); }
  void end() { service_.clear(); }
  [[nodiscard]] bool canBe(ContractUser /*user*/) const { return true; }
  Client connect(ContractUser user) {
    return Client(service_.connect(
        ++lastProcess_, user == ContractUser::kOwner ? FakeUser::kOwner : FakeUser::kStranger));
  }
  bool letHappen(const std::function<bool()>& condition) { return condition(); }

 private:
  Journal journal_;
  FakeConnectionService service_{journal_};
  ProcessID lastProcess_ = 100;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ConnectionContract, FakeHarness);

}  // namespace halvox::platform::contract
