#pragma once

#include <cstdint>
#include <string>
#include <variant>
#include <vector>

#include <systemd/sd-bus.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// The answer of a method: its first value as text, or the name and text of an error.
struct BusAnswer {
  std::string text;
  std::string errorName;
  std::string errorText;
};

// An ordinary client, which uses the systemd library.
class BusClient {
 public:
  enum class Kind : bool { kPeer, kBusClient };

  // A client of a bus sends Hello first, a client of our own socket does not. Throws if it cannot
  // connect.
  explicit BusClient(const std::string& address, Kind kind = Kind::kBusClient);

  // Calls a method of the test's object, with one text or without arguments.
  BusAnswer call(const std::string& member, const std::string& text);
  BusAnswer call(const std::string& member);
  // Calls any method without arguments or with text arguments.
  BusAnswer callAt(const std::string& path, const std::string& interface, const std::string& member,
                   const std::vector<std::string>& texts = {});
  void setDestination(std::string name) { destination_ = std::move(name); }
  [[nodiscard]] std::string uniqueName() const;
  [[nodiscard]] sd_bus* get() const { return bus_.get(); }

 private:
  UniqueHandle<sd_bus*, sd_bus_flush_close_unref> bus_;
  std::string destination_;
};

using BusMessage = UniqueHandle<sd_bus_message*, sd_bus_message_unref>;

}  // namespace halvox::platform::linux_
