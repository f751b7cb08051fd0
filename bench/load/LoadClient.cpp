#include "bench/load/LoadClient.h"

#include <chrono>
#include <stdexcept>
#include <thread>

#include <systemd/sd-bus.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::bench {
namespace {

constexpr const char* kPath = "/com/tarno/halvox/reporting";
constexpr const char* kInterface = "com.tarno.halvox.HVReportingServiceProtocol";
constexpr std::uint32_t kPlayback = 4;
constexpr std::uint16_t kState = 18;

void check(int result, const char* what) {
  if (result < 0)
    throw std::runtime_error(std::string(what) + ": " + platform::linux_::errnoText(-result));
}

struct Unref {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, Unref>;

Message newCall(sd_bus* bus, const char* member) {
  sd_bus_message* message = nullptr;
  check(sd_bus_message_new_method_call(bus, &message, nullptr, kPath, kInterface, member), member);
  return Message(message);
}

int countAnswer(sd_bus_message* message, void* userdata, sd_bus_error* /*error*/) {
  if (sd_bus_message_is_method_error(message, nullptr) > 0) {
    throw std::runtime_error(sd_bus_message_get_error(message)->message);
  }
  ++*static_cast<std::int64_t*>(userdata);
  return 1;
}

int ignoreAnswer(sd_bus_message* /*message*/, void* /*userdata*/, sd_bus_error* /*error*/) {
  return 1;
}

// Adds fields of the kinds that real messages have: numbers, texts and flags.
void appendField(sd_bus_message* message, int field, std::int64_t number, const std::string& text) {
  const std::string key = "field_number_" + std::to_string(field);
  int result = 0;
  switch (field % 5) {
    case 0:
      result = sd_bus_message_append(message, "{sv}", key.c_str(), "x", number);
      break;
    case 1:
      result = sd_bus_message_append(message, "{sv}", key.c_str(), "d", 0.5);
      break;
    case 2:
      result = sd_bus_message_append(message, "{sv}", key.c_str(), "s", text.c_str());
      break;
    case 3:
      result = sd_bus_message_append(message, "{sv}", key.c_str(), "u", 48000U);
      break;
    default:
      result = sd_bus_message_append(message, "{sv}", key.c_str(), "b", 1);
      break;
  }
  check(result, "append");
}

Message newSendMessage(sd_bus* bus, std::int64_t reporter, std::int64_t number,
                       const MessageShape& shape) {
  Message message = newCall(bus, "sendMessage");
  const std::string text(static_cast<std::size_t>(shape.textBytes), 't');
  check(sd_bus_message_open_container(message.get(), 'a', "{sv}"), "open");
  for (int field = 0; field < shape.fields; ++field) {
    appendField(message.get(), field, number, text);
  }
  check(sd_bus_message_close_container(message.get()), "close");
  check(sd_bus_message_append(message.get(), "uqaax", kPlayback, static_cast<int>(kState), 1, 1,
                              reporter),
        "append");
  return message;
}

}  // namespace

LoadClient::LoadClient(const std::string& socketPath, std::int64_t reporter, bool withSession)
    : reporter_(reporter) {
  check(sd_bus_new(&bus_), "sd_bus_new");
  check(sd_bus_set_address(bus_, ("unix:path=" + socketPath).c_str()), "address");
  check(sd_bus_start(bus_), "connect");
  // Complete the handshake first. sd-bus in the echo overlooks a message that arrives together with
  // the end of the handshake.
  while (sd_bus_is_ready(bus_) == 0) {
    const int progress = sd_bus_process(bus_, nullptr);
    check(progress, "handshake");
    if (progress == 0) check(sd_bus_wait(bus_, UINT64_MAX), "handshake");
  }
  if (!withSession) return;
  call("createReportingSession", reporter);
  // The service answers a start only at the stop. The answer to the next call shows that the
  // session was started.
  Message start = newCall(bus_, "startReportingSessionForID");
  check(sd_bus_message_append(start.get(), "x", reporter), "append");
  check(sd_bus_call_async(bus_, nullptr, start.get(), ignoreAnswer, nullptr, UINT64_MAX), "start");
  call("reporterIDValid", reporter);
}

LoadClient::~LoadClient() { sd_bus_flush_close_unref(bus_); }

void LoadClient::call(const char* member, std::int64_t argument) {
  Message message = newCall(bus_, member);
  check(sd_bus_message_append(message.get(), "x", argument), "append");
  sd_bus_message* reply = nullptr;
  check(sd_bus_call(bus_, message.get(), 0, nullptr, &reply), member);
  sd_bus_message_unref(reply);
}

double LoadClient::ask() {
  const auto begin = std::chrono::steady_clock::now();
  call("reporterIDValid", reporter_);
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

void LoadClient::stop() { call("stopReportingSessionForID", reporter_); }

void LoadClient::createSessions(std::int64_t first, std::int64_t count) {
  for (std::int64_t id = first; id < first + count; ++id) call("createReportingSession", id);
}

void LoadClient::sendOne(std::int64_t number, const MessageShape& shape) {
  const Message message = newSendMessage(bus_, reporter_, number, shape);
  // The call has no time-out, because slow answers are measured too.
  check(sd_bus_call_async(bus_, nullptr, message.get(), countAnswer, &answered_, UINT64_MAX),
        "send");
}

void LoadClient::pipeline(std::int64_t count, std::int64_t window, const MessageShape& shape) {
  answered_ = 0;
  std::int64_t sent = 0;
  while (answered_ < count) {
    while (sent < count && sent - answered_ < window) {
      // The number is a field of the message, and equal numbers make equal messages.
      sendOne(shape.content == Content::kDistinct ? sent : 0, shape);
      ++sent;
    }
    // Handle half a window of answers before sending again, so that both sides work in batches.
    int result = 0;
    while ((result = sd_bus_process(bus_, nullptr)) > 0 && sent - answered_ > window / 2) {
    }
    check(result, "process");
    if (result == 0) check(sd_bus_wait(bus_, UINT64_MAX), "wait");
  }
}

std::vector<double> LoadClient::ping(int count, const MessageShape& shape) {
  using Clock = std::chrono::steady_clock;
  std::vector<double> seconds;
  seconds.reserve(static_cast<std::size_t>(count));
  for (int number = 0; number < count; ++number) {
    const Message message = newSendMessage(bus_, reporter_, number, shape);
    const auto begin = Clock::now();
    sd_bus_message* reply = nullptr;
    check(sd_bus_call(bus_, message.get(), 0, nullptr, &reply), "send");
    seconds.push_back(std::chrono::duration<double>(Clock::now() - begin).count());
    sd_bus_message_unref(reply);
    // Sleeps only after the answer has come, so that at most one request is on its way.
    std::this_thread::sleep_until(begin + std::chrono::milliseconds(1));
  }
  return seconds;
}

}  // namespace halvox::bench
