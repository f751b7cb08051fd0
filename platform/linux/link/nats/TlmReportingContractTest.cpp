// Runs the contract suite of the real-time framework on the adapter over NATS, with a real server.

#include "platform/fake/contracts/TlmReportingContract.h"

#include <array>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/store/spool/testing/FakeLinkSpool.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::contract {
namespace {

using linux_::eventually;
using linux_::UniqueFd;

sockaddr_in loopback(int port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(static_cast<std::uint16_t>(port));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  return address;
}

// Returns a loopback port that was free a moment ago.
int freePort() {
  const UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address = loopback(0);
  socklen_t size = sizeof(address);
  auto* const generic = reinterpret_cast<sockaddr*>(&address);
  if (::bind(socket.get(), generic, size) != 0) return 0;
  if (::getsockname(socket.get(), generic, &size) != 0) return 0;
  return ntohs(address.sin_port);
}

bool accepts(int port) {
  const UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const sockaddr_in address = loopback(port);
  return ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
}

// One nats-server with JetStream in a scratch directory, for all tests of this program. The kernel
// kills the server when the program ends, even if the program is killed.
class NatsServer {
 public:
  // Null if nats-server is not installed or does not start.
  static NatsServer* shared() {
    static const auto server = std::make_unique<NatsServer>();
    return server->isUp_ ? server.get() : nullptr;
  }

  NatsServer() {
    const std::filesystem::path config = scratch_.path() / "server.conf";
    std::ofstream(config) << "listen: \"127.0.0.1:" << port_ << "\"\njetstream { store_dir: \""
                          << scratch_.path().string() << "/store\" }\n";
    pid_ = ::fork();
    if (pid_ == 0) serve(config.c_str());
    isUp_ = eventually([this] { return hasEnded() || accepts(port_); }) && !hasEnded();
  }
  NatsServer(const NatsServer&) = delete;
  NatsServer& operator=(const NatsServer&) = delete;
  ~NatsServer() {
    if (hasEnded()) return;
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }

  [[nodiscard]] std::string url() const { return "nats://127.0.0.1:" + std::to_string(port_); }

 private:
  [[noreturn]] static void serve(const char* config) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const int silence = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
    ::dup2(silence, STDOUT_FILENO);
    ::dup2(silence, STDERR_FILENO);
    ::execlp("nats-server", "nats-server", "-c", config, nullptr);
    ::_exit(127);
  }
  bool hasEnded() {
    if (!hasEnded_) hasEnded_ = ::waitpid(pid_, nullptr, WNOHANG) == pid_;
    return hasEnded_;
  }

  const linux_::ScratchDirectory scratch_;
  const int port_ = freePort();
  pid_t pid_ = -1;
  bool hasEnded_ = false;
  bool isUp_ = false;
};

// The other services. They are never destroyed, because the back-end keeps a reference to its log
// category.
FakePlatform& neighbours() {
  static auto* const platform = new FakePlatform;
  return *platform;
}

// With or without a spool, in which the first messages wait here for the connection.
template <bool kHasSpool>
class NatsHarness {
 public:
  static constexpr bool kFindsBackends = true;
  static constexpr bool kTakesMessages = true;

  static bool isAvailable() { return NatsServer::shared() != nullptr; }

  NatsHarness() {
    if (!isAvailable()) return;
    static int lastStream = kHasSpool ? 1000 : 0;
    linux_::Configuration::Link options;
    options.servers = {NatsServer::shared()->url()};
    options.stream = "CONTRACT" + std::to_string(++lastStream);
    options.subject = "contract" + std::to_string(lastStream);
    stream_ = options.stream;
    link_ = linux_::makeNatsTlmReporting(options,
                                         {dispatch_, statistics_, kHasSpool ? &spool_ : nullptr});
    link_->resume();
  }
  ~NatsHarness() {
    if (link_ == nullptr) return;
    // The server reserves disk space for each stream, and has not enough for those of all tests.
    if (!reader_) connect();
    static_cast<void>(js_DeleteStream(reader_.get(), stream_.c_str(), nullptr, nullptr));
    reader_.reset();
    connection_.reset();
    dispatch_.stop(std::chrono::seconds(5));
    static_cast<void>(link_->close());
  }
  NatsHarness(const NatsHarness&) = delete;
  NatsHarness& operator=(const NatsHarness&) = delete;

  TLMReportingService& service() { return *link_; }
  static bool letRunUntil(const std::function<bool()>& condition) { return eventually(condition); }
  std::vector<std::int64_t> arrived() {
    if (!reader_) connect();
    // Ask for messages only when there are some: the server crashes if it is asked for a message of
    // a stream that is being created.
    linux_::JetStreamInfo info;
    const natsStatus status =
        js_GetStreamInfo(info.out(), reader_.get(), stream_.c_str(), nullptr, nullptr);
    const std::uint64_t messages = status == NATS_OK ? info.get()->State.Msgs : 0;
    while (arrived_.size() < messages && readNext()) {
    }
    return arrived_;
  }
  void breakSending() { static_cast<void>(link_->close()); }

 private:
  void connect() {
    ASSERT_EQ(natsConnection_ConnectTo(connection_.out(), NatsServer::shared()->url().c_str()),
              NATS_OK);
    ASSERT_EQ(natsConnection_JetStream(reader_.out(), connection_.get(), nullptr), NATS_OK);
  }
  bool readNext() {
    linux_::NatsMessage message;
    if (js_GetMsg(message.out(), reader_.get(), stream_.c_str(), arrived_.size() + 1, nullptr,
                  nullptr) != NATS_OK) {
      return false;
    }
    const std::string text(natsMsg_GetData(message.get()),
                           static_cast<std::size_t>(natsMsg_GetDataLength(message.get())));
    constexpr std::string_view kBefore = R"("payload":{"n":)";
    arrived_.push_back(std::stoll(text.substr(text.find(kBefore) + kBefore.size())));
    return true;
  }

  linux_::CounterStatisticsService statistics_;
  linux_::FakeLinkSpool spool_;
  linux_::AsioDispatchService dispatch_{neighbours().log, statistics_};
  std::string stream_;
  std::unique_ptr<linux_::NatsTlmReporting> link_;
  linux_::NatsConnection connection_;
  linux_::JetStreamContext reader_;
  std::vector<std::int64_t> arrived_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Nats, TlmReportingContract, NatsHarness<false>);
INSTANTIATE_TYPED_TEST_SUITE_P(NatsWithSpool, TlmReportingContract, NatsHarness<true>);

}  // namespace halvox::platform::contract
