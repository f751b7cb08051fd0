#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

struct sd_bus;

namespace halvox::bench {

enum class Content : std::uint8_t { kDistinct, kRepeated };

// What is sent. A repeated message is the same each time, so a started session drops it as
// redundant and its history does not grow.
struct MessageShape {
  int fields = 10;
  int textBytes = 16;
  Content content = Content::kDistinct;
};

// One client on sd-bus: a connection with one started session. Belongs to one thread.
class LoadClient {
 public:
  // Connects; when `withSession`, creates and starts a session of that identifier first.
  LoadClient(const std::string& socketPath, std::int64_t reporter, bool withSession);
  ~LoadClient();
  LoadClient(const LoadClient&) = delete;
  LoadClient& operator=(const LoadClient&) = delete;

  // Sends that many messages, never more than `window` unanswered, and waits for all answers.
  void pipeline(std::int64_t count, std::int64_t window, const MessageShape& shape);
  // Sends one message every millisecond, each after the answer to the last; seconds per answer.
  std::vector<double> ping(int count, const MessageShape& shape);
  // Asks something that looks nothing up in a long list; seconds to the answer.
  double ask();
  // Stops its session.
  void stop();
  // Creates (and does not start) sessions from that identifier on.
  void createSessions(std::int64_t first, std::int64_t count);

 private:
  void call(const char* member, std::int64_t argument);
  void sendOne(std::int64_t number, const MessageShape& shape);

  sd_bus* bus_ = nullptr;
  std::int64_t reporter_;
  std::int64_t answered_ = 0;
};

}  // namespace halvox::bench
