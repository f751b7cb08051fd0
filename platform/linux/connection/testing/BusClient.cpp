#include "platform/linux/connection/testing/BusClient.h"

#include <stdexcept>

#include "platform/linux/connection/testing/ServiceUnderTest.h"
#include "platform/linux/connection/testing/TestInterface.h"

namespace halvox::platform::linux_ {
namespace {

// Returns the first value of an answer as text.
std::string firstValue(sd_bus_message* message) {
  char type = 0;
  const char* contents = nullptr;
  if (sd_bus_message_peek_type(message, &type, &contents) <= 0) return "";
  switch (type) {
    case 's': {
      const char* text = "";
      sd_bus_message_read_basic(message, type, &text);
      return text;
    }
    case 'b': {
      int flag = 0;
      sd_bus_message_read_basic(message, type, &flag);
      return flag != 0 ? "true" : "false";
    }
    case 'u': {
      std::uint32_t number = 0;
      sd_bus_message_read_basic(message, type, &number);
      return std::to_string(number);
    }
    default:
      return std::string(1, type) + contents;
  }
}

void check(int result, const char* what) {
  if (result < 0) throw std::runtime_error(what);
}

}  // namespace

BusClient::BusClient(const std::string& address, Kind kind) {
  check(sd_bus_new(bus_.out()), "sd_bus_new");
  check(sd_bus_set_address(bus_.get(), address.c_str()), "sd_bus_set_address");
  check(sd_bus_set_bus_client(bus_.get(), kind == Kind::kBusClient ? 1 : 0), "bus client");
  check(sd_bus_start(bus_.get()), "sd_bus_start");
}

std::string BusClient::uniqueName() const {
  const char* name = "";
  sd_bus_get_unique_name(bus_.get(), &name);
  return name;
}

BusAnswer BusClient::call(const std::string& member, const std::string& text) {
  return callAt(kTestPath, kTestInterface, member, {text});
}

BusAnswer BusClient::call(const std::string& member) {
  return callAt(kTestPath, kTestInterface, member);
}

BusAnswer BusClient::callAt(const std::string& path, const std::string& interface,
                            const std::string& member, const std::vector<std::string>& texts) {
  BusMessage message;
  check(sd_bus_message_new_method_call(
            bus_.get(), message.out(), destination_.empty() ? nullptr : destination_.c_str(),
            path.c_str(), interface.empty() ? nullptr : interface.c_str(), member.c_str()),
        "new call");
  for (const std::string& text : texts) {
    check(sd_bus_message_append_basic(message.get(), 's', text.c_str()), "append");
  }
  sd_bus_error error = SD_BUS_ERROR_NULL;
  BusMessage reply;
  using std::chrono::microseconds;
  const auto timeout = std::chrono::duration_cast<microseconds>(kTestDeadline).count();
  const int result = sd_bus_call(bus_.get(), message.get(), static_cast<std::uint64_t>(timeout),
                                 &error, reply.out());
  BusAnswer answer;
  if (result < 0) {
    answer.errorName = error.name != nullptr ? error.name : "";
    answer.errorText = error.message != nullptr ? error.message : "";
  } else {
    answer.text = firstValue(reply.get());
  }
  sd_bus_error_free(&error);
  return answer;
}

}  // namespace halvox::platform::linux_
