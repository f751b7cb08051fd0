#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

struct sd_bus;

namespace halvox::bench {

enum class Content : std::uint8_t { kDistinct, kRepeated };

// The shape of the messages. A repeated message is the same each time: a started session drops it
// as redundant, and its history does not grow.
struct MessageShape {
  int fields = 10;
  int textBytes = 16;
  Content content = Content::kDistinct;
};

// A client on sd-bus: a connection with at most one started session. Belongs to one thread. Throws
// std::runtime_error on any failure.
class LoadClient {
 public:
  // Connects and, if `withSession` is true, creates and starts a session with that identifier.
  LoadClient(const std::string& socketPath, std::int64_t reporter, bool withSession);
  ~LoadClient();
  LoadClient(const LoadClient&) = delete;
  LoadClient& operator=(const LoadClient&) = delete;

  // Sends `count` messages with at most `window` unanswered, and waits for all answers.
  void pipeline(std::int64_t count, std::int64_t window, const MessageShape& shape);
  // Sends one message a millisecond, each after the answer to the one before. Returns the time to
  // each answer in seconds.
  std::vector<double> ping(int count, const MessageShape& shape);
  // Sends a request that is cheap to answer. Returns the time to the answer in seconds.
  double ask();
  // Stops the session and waits for the answer.
  void stop();
  // Creates `count` sessions with identifiers from `first` on, without starting them.
  void createSessions(std::int64_t first, std::int64_t count);

 private:
  // Sends a request with one number and waits for the answer. Throws if that is an error.
  void call(const char* member, std::int64_t argument);
  // Sends a message without waiting; its answer is counted in answered_.
  void sendOne(std::int64_t number, const MessageShape& shape);

  sd_bus* bus_ = nullptr;
  std::int64_t reporter_;
  std::int64_t answered_ = 0;
};

}  // namespace halvox::bench
