#pragma once

#include <cstddef>
#include <string_view>
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

// Decides what happens to one message. The dispatcher delivers the message to a method of the
// client's exported object, answers it through a standard interface, or refuses it with an error
// that says what is wrong. Belongs to the I/O thread. Owned by the host. Does not own the arguments
// of its constructor, which must outlive it.
class RequestDispatcher {
 public:
  RequestDispatcher(const ConnectionOptions& options, ConnectionStatistics& statistics,
                    const ServiceIdentity& identity);

  // `frameBytes` is the size of the message on the wire. The client's connection may end during
  // this call.
  void dispatch(ClientConnection& client, const dbus::Frame& frame, std::size_t frameBytes);

 private:
  struct Request;

  void deliver(const Request& request, const InterfaceMethod& method);
  void post(const Request& request, const InterfaceMethod& method, FlowControl::Cost cost);
  [[nodiscard]] bool isForbidden(const Request& request, std::string_view method);
  [[nodiscard]] bool isOverLimits(const Request& request, const InterfaceMethod& method);
  [[nodiscard]] bool namesTooManyReporters(const Request& request, const InterfaceMethod& method);
  void answerStandard(const Request& request, const StandardMethod& method);
  [[nodiscard]] bool decode(const Request& request, std::string_view signature);
  void refuseUnknown(const Request& request);

  const ConnectionOptions& options_;
  ConnectionStatistics& statistics_;
  StandardInterfaces standard_;
  // Both are empty between requests. They are members to keep their capacity: decoding then
  // allocates only the values.
  std::vector<Value> arguments_;
  dbus::DecodeScratch scratch_;
};

}  // namespace halvox::platform::linux_
