#pragma once

#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/connection/StorageControl.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

class ClientConnection;

// What D-Bus clients can ask about the identity of the service.
struct ServiceIdentity {
  std::string guidHex;     // 32 hexadecimal digits, random at each start
  std::string busName;     // the well-known name
  std::string machineHex;  // 32 hexadecimal digits; empty if the machine has no ID
};

// Reads the counters of the service; see ConnectionOptions::counters.
using CounterReader = std::function<Dictionary()>;

// The answer of a standard method: a value, or an error when `errorName` is not empty.
struct StandardAnswer {
  Value value{};
  std::string_view errorName{};
  std::string errorText{};
};

// One call of a standard method. Everything in it is valid only during the call.
struct StandardRequest {
  ClientConnection& client;
  std::string_view path;
  std::span<const Value> arguments;
  const ServiceIdentity& identity;
  const CounterReader& counters;
  const StorageControl& storage;
};

// Which objects have a standard method.
enum class StandardScope : std::uint8_t {
  kEverywhere,     // any path at all
  kTree,           // the exported object and its parents
  kObject,         // the exported object
  kStandInForBus,  // any path, for clients without a bus
};

struct StandardMethod {
  std::string_view interface;
  std::string_view name;
  std::string_view in;
  std::string_view out;
  StandardScope scope = StandardScope::kEverywhere;
  StandardAnswer (*answer)(const StandardRequest& request) = nullptr;
  MethodAccess access = MethodAccess::kAnybody;
};

// The methods that the adapter answers itself.
std::span<const StandardMethod> objectMethods();  // of the interfaces that the object has
std::span<const StandardMethod> busMethods();     // what a client asks its bus for

// Which part of a request names something that does not exist.
enum class UnknownPart : std::uint8_t { kObject, kInterface, kMethod };

// The interfaces of D-Bus itself, which the adapter answers on behalf of the exported object.
// Client libraries make a few calls to the bus. For clients on our own socket, which has no bus,
// the adapter answers these calls, too, and the libraries then work unchanged.
//
// Two interfaces are our own: com.tarno.halvox.Statistics, whose GetCounters answers what the
// service has counted since its start, and com.tarno.halvox.Storage, which deletes stored records.
// They are not part of the exported object, because counters and store belong to the platform and
// not to the protocol.
//
// Belongs to the I/O thread. Owned by the dispatcher. Does not own its arguments.
class StandardInterfaces {
 public:
  StandardInterfaces(const ServiceIdentity& identity, const CounterReader& counters,
                     const StorageControl& storage)
      : identity_(identity), counters_(counters), storage_(storage) {}

  // Returns the standard method that a request asks for, or null if it asks for none.
  [[nodiscard]] const StandardMethod* find(const ClientConnection& client,
                                           const dbus::MessageHeader& request) const;
  // Returns the unknown part of a request. Only for requests for which neither find() nor the
  // exported object has a method.
  [[nodiscard]] UnknownPart unknownPartOf(const ClientConnection& client,
                                          const dbus::MessageHeader& request) const;
  [[nodiscard]] const ServiceIdentity& identity() const { return identity_; }
  [[nodiscard]] const CounterReader& counters() const { return counters_; }
  [[nodiscard]] const StorageControl& storage() const { return storage_; }

 private:
  const ServiceIdentity& identity_;
  const CounterReader& counters_;
  const StorageControl& storage_;
};

// Returns true if `path` is a parent of `objectPath`. The root is a parent of all others.
bool isParentPath(std::string_view path, std::string_view objectPath);

}  // namespace halvox::platform::linux_
