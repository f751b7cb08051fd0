#include "platform/linux/connection/StandardInterfaces.h"

#include <algorithm>
#include <array>
#include <utility>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/ErrorNames.h"
#include "platform/linux/connection/Introspection.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kPeer = "org.freedesktop.DBus.Peer";
constexpr std::string_view kIntrospectable = "org.freedesktop.DBus.Introspectable";
constexpr std::string_view kProperties = "org.freedesktop.DBus.Properties";
constexpr std::string_view kStatistics = "com.tarno.halvox.Statistics";
constexpr std::string_view kStorage = "com.tarno.halvox.Storage";

StandardAnswer ping(const StandardRequest& /*request*/) { return {}; }

StandardAnswer getMachineId(const StandardRequest& request) {
  if (!request.identity.machineHex.empty()) return {.value = Value(request.identity.machineHex)};
  return {.errorName = error_names::kFailed,
          .errorText = "this machine has no ID (/etc/machine-id)"};
}

StandardAnswer introspect(const StandardRequest& request) {
  return {.value = Value(introspectionOf(*request.client.exportedInterface(), request.path))};
}

StandardAnswer unknownProperty(const StandardRequest& request) {
  return {.errorName = error_names::kUnknownProperty,
          .errorText = "there is no property \"" + std::string(request.arguments[1].string()) +
                       "\"; the object has none"};
}

// A GLib proxy asks for all properties when it is made. The object has none, and an empty
// dictionary is a valid answer.
StandardAnswer noProperties(const StandardRequest& /*request*/) {
  return {.value = Value(Dictionary{})};
}

// Read at each request and never kept: while nobody asks, the counters cost nothing.
StandardAnswer getCounters(const StandardRequest& request) {
  return {.value = Value(request.counters ? request.counters() : Dictionary{})};
}

template <auto Begin>
StandardAnswer beginWork(const StandardRequest& request) {
  const auto& begin = request.storage.*Begin;
  std::string problem = begin ? begin(request.arguments[0].dictionary()) : "there is no store";
  if (problem.empty()) return {};
  return {.errorName = error_names::kFailed, .errorText = std::move(problem)};
}

template <auto State>
StandardAnswer getWork(const StandardRequest& request) {
  const auto& state = request.storage.*State;
  return {.value = Value(state ? state() : Dictionary{})};
}

// Keep the methods of one interface together, because the introspection writes one interface
// element for each run of methods with the same interface.
//
// The scope of Peer is every path, because D-Bus defines Peer even for paths without an object.
constexpr std::array kObjectMethods = {
    StandardMethod{kPeer, "Ping", "", "", StandardScope::kEverywhere, ping},
    StandardMethod{kPeer, "GetMachineId", "", "s", StandardScope::kEverywhere, getMachineId},
    StandardMethod{kIntrospectable, "Introspect", "", "s", StandardScope::kTree, introspect},
    StandardMethod{kProperties, "Get", "ss", "v", StandardScope::kObject, unknownProperty},
    StandardMethod{kProperties, "GetAll", "s", "a{sv}", StandardScope::kObject, noProperties},
    StandardMethod{kProperties, "Set", "ssv", "", StandardScope::kObject, unknownProperty},
    StandardMethod{kStatistics, "GetCounters", "", "a{sv}", StandardScope::kObject, getCounters},
    StandardMethod{kStorage, "BeginVacuum", "a{sv}", "", StandardScope::kObject,
                   beginWork<&StorageControl::beginVacuum>, MethodAccess::kOwner},
    StandardMethod{kStorage, "GetVacuum", "", "a{sv}", StandardScope::kObject,
                   getWork<&StorageControl::vacuumState>, MethodAccess::kOwner},
    StandardMethod{kStorage, "BeginErase", "a{sv}", "", StandardScope::kObject,
                   beginWork<&StorageControl::beginErase>, MethodAccess::kOwner},
    StandardMethod{kStorage, "GetErase", "", "a{sv}", StandardScope::kObject,
                   getWork<&StorageControl::eraseState>, MethodAccess::kOwner},
};

bool isExportedObject(const ClientConnection& client, std::string_view path) {
  const NSXPCInterface* exported = client.exportedInterface();
  return exported != nullptr && client.exportedObject() != nullptr && path == exported->objectPath;
}

bool isInTree(const ClientConnection& client, std::string_view path) {
  const NSXPCInterface* exported = client.exportedInterface();
  if (exported == nullptr || client.exportedObject() == nullptr) return false;
  // Tools introspect the root and then each child, until they find the object.
  return path == exported->objectPath || isParentPath(path, exported->objectPath);
}

bool isInScope(const ClientConnection& client, const StandardMethod& method,
               std::string_view path) {
  switch (method.scope) {
    case StandardScope::kEverywhere:
      return true;
    case StandardScope::kTree:
      return isInTree(client, path);
    case StandardScope::kObject:
      return isExportedObject(client, path);
    case StandardScope::kStandInForBus:
      return client.isPeerToPeer();
  }
  return false;
}

const StandardMethod* findIn(std::span<const StandardMethod> methods,
                             const ClientConnection& client, const dbus::MessageHeader& request) {
  const auto found =
      std::find_if(methods.begin(), methods.end(), [&](const StandardMethod& method) {
        return method.name == request.member &&
               (request.interface.empty() || request.interface == method.interface) &&
               isInScope(client, method, request.path);
      });
  return found != methods.end() ? &*found : nullptr;
}

bool isInterfaceOf(std::span<const StandardMethod> methods, const ClientConnection& client,
                   const dbus::MessageHeader& request) {
  return std::any_of(methods.begin(), methods.end(), [&](const StandardMethod& method) {
    return method.interface == request.interface && isInScope(client, method, request.path);
  });
}

}  // namespace

std::span<const StandardMethod> objectMethods() { return kObjectMethods; }

bool isParentPath(std::string_view path, std::string_view objectPath) {
  if (path == "/") return objectPath != "/";
  return objectPath.size() > path.size() && objectPath.starts_with(path) &&
         objectPath[path.size()] == '/';
}

const StandardMethod* StandardInterfaces::find(const ClientConnection& client,
                                               const dbus::MessageHeader& request) const {
  const StandardMethod* method = findIn(kObjectMethods, client, request);
  // Look in the methods of the bus last. A client on a real bus finds none of them here, because
  // the bus itself answers them.
  return method != nullptr ? method : findIn(busMethods(), client, request);
}

UnknownPart StandardInterfaces::unknownPartOf(const ClientConnection& client,
                                              const dbus::MessageHeader& request) const {
  // Test for an unknown method first and for an unknown object second. A client that names the
  // right interface should learn that only the method is wrong.
  const bool isOwnInterface = isExportedObject(client, request.path) &&
                              request.interface == client.exportedInterface()->name;
  if (isOwnInterface || isInterfaceOf(kObjectMethods, client, request) ||
      isInterfaceOf(busMethods(), client, request)) {
    return UnknownPart::kMethod;
  }
  if (!isInTree(client, request.path)) return UnknownPart::kObject;
  return request.interface.empty() ? UnknownPart::kMethod : UnknownPart::kInterface;
}

}  // namespace halvox::platform::linux_
