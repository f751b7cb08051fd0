// Reports under load through the client library while the service is restarted.
//
//   halvox_restart_client SOCKET CLIENTS
//     Makes that many clients, each with a session of its own. For each line of standard input,
//     each client sends messages at once, with the number of the client ("client") and of the
//     message
//     ("n"), and stops and starts its session between them. Prints "sent" when the first of these
//     messages are answered; the others are then on their way. When standard input ends, waits
//     until everything is answered, and prints a line of JSON for each client: how many messages
//     were accepted, and what became of them.

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "client/HalvoxClient.h"

namespace {

using halvox::client::Counters;
using halvox::client::HalvoxClient;
using halvox::client::Options;

constexpr halvox::client::Category kPlayback = 4;
constexpr halvox::client::EventType kStart = 1;
// Several times as many as a connection answers before it is read from again, and fewer than a
// client keeps while there is no service.
constexpr int kAtOnce = 2000;
constexpr int kMessagesOfSession = 300;
constexpr std::chrono::seconds kPatience{60};

class Reporter {
 public:
  Reporter(const std::string& socket, int number)
      : number_(number), session_(100 + number), client_(Options{.socketPath = socket}) {
    client_.createSession(session_);
    client_.start(session_);
  }

  void send() {
    for (int count = 0; count < kAtOnce; ++count) {
      if (client_.send(session_, {{"client", number_}, {"n", accepted_}}, kPlayback, kStart)) {
        ++accepted_;
      }
      if (accepted_ % kMessagesOfSession != 0) continue;
      client_.stop(session_);
      client_.start(session_);
    }
  }

  void waitForAnAnswer() const {
    const std::uint64_t before = client_.counters().acknowledged;
    while (client_.counters().pending > 0 && client_.counters().acknowledged == before) {
      std::this_thread::yield();
    }
  }

  void report() {
    const bool isFlushed = client_.flush(kPatience);
    const Counters counters = client_.counters();
    std::cout << "{\"client\": " << number_ << ", \"accepted\": " << accepted_
              << ", \"acknowledged\": " << counters.acknowledged << ", \"lost\": " << counters.lost
              << ", \"reconnects\": " << counters.reconnects
              << ", \"flushed\": " << (isFlushed ? "true" : "false") << "}" << std::endl;
  }

 private:
  const int number_;
  const std::int64_t session_;
  HalvoxClient client_;
  std::int64_t accepted_ = 0;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 3) {
    std::cerr << "usage: halvox_restart_client SOCKET CLIENTS\n";
    return EXIT_FAILURE;
  }
  std::vector<std::unique_ptr<Reporter>> reporters(static_cast<std::size_t>(std::atoi(argv[2])));
  for (int number = 0; auto& reporter : reporters) {
    reporter = std::make_unique<Reporter>(argv[1], number++);
  }
  std::string line;
  while (std::getline(std::cin, line)) {
    for (const auto& reporter : reporters) reporter->send();
    for (const auto& reporter : reporters) reporter->waitForAnAnswer();
    std::cout << "sent" << std::endl;
  }
  for (const auto& reporter : reporters) reporter->report();
  return EXIT_SUCCESS;
}
