#pragma once

#include <cstddef>
#include <vector>

#include "platform/connection.h"
#include "platform/linux/connection/FlowControl.h"
#include "platform/linux/connection/StandardInterfaces.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_ {

class ClientConnection;
struct ConnectionOptions;
struct ConnectionStatistics;

// Decides what happens to one message: it is delivered to a method of the client's exported object,
// answered by a standard interface, or refused with an error that says what is wrong with it.
// Belongs to the I/O thread. Owned by the host. Does not own what it is made with, which must
// outlive it.
class RequestDispatcher {
 public:
  RequestDispatcher(const ConnectionOptions& options, ConnectionStatistics& statistics,
                    const ServiceIdentity& identity);

  // `frameBytes` is the size of the message on the wire. The client may end in this call.
  void dispatch(ClientConnection& client, const dbus::Frame& frame, std::size_t frameBytes);

 private:
  struct Request;

  void deliver(const Request& request, const InterfaceMethod& method);
  void post(const Request& request, const InterfaceMethod& method, FlowControl::Cost cost);
  [[nodiscard]] bool isForbidden(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool isOverLimits(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool namesTooManyReporters(const Request& request, const InterfaceMethod& method);
  void answerStandard(const Request& request, const StandardMethod& method);
  [[nodiscard]] bool decode(const Request& request, std::string_view signature);
  void refuseUnknown(const Request& request);

  const ConnectionOptions& options_;
  ConnectionStatistics& statistics_;
  StandardInterfaces standard_;
  // Empty between requests. Both are kept for their capacity: decoding then allocates values only.
  std::vector<Value> arguments_;
  dbus::DecodeScratch scratch_;
};

}  // namespace halvox::platform::linux_
