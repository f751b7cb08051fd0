#pragma once

#include <cstddef>
#include <vector>

#include "platform/connection.h"
#include "platform/linux/connection/StandardInterfaces.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

class ClientConnection;
struct ConnectionOptions;
struct ConnectionStatistics;

// Takes one message to where it belongs: a method of the client's exported object, one of the
// standard interfaces, or a refusal that says what is wrong with it.
// Belongs to the I/O thread. Does not own what it is made with.
class RequestDispatcher {
 public:
  RequestDispatcher(const ConnectionOptions& options, ConnectionStatistics& statistics,
                    const ServiceIdentity& identity);

  // `frameBytes` is the size of the message on the wire. The client may have ended afterwards.
  void dispatch(ClientConnection& client, const dbus::Frame& frame, std::size_t frameBytes);

 private:
  struct Request;

  void deliver(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool isForbidden(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool isOverLimits(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool namesTooManyReporters(const Request& request, const InterfaceMethod& method);
  void answerStandard(const Request& request, const StandardMethod& method);
  [[nodiscard]] bool decode(const Request& request, std::string_view signature);
  void refuseUnknown(const Request& request);

  const ConnectionOptions& options_;
  ConnectionStatistics& statistics_;
  StandardInterfaces standard_;
  std::vector<Value> arguments_;  // of the request that is being delivered; kept for its capacity
};

}  // namespace halvox::platform::linux_
