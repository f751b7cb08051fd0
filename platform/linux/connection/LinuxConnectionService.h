#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/connection.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/configuration/Defaults.h"
#include "platform/linux/connection/BusAddress.h"
#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/StorageControl.h"
#include "platform/linux/dispatch/Backpressure.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

class ConnectionHost;
class ListeningSocket;

// Whether the loop handles signals: SIGTERM and SIGINT end the listener's resume(), and SIGUSR1
// asks for a report.
enum class EndSignals : std::uint8_t { kHandle, kLeaveAlone };

// Which users may connect to the socket's file.
struct SocketAccess {
  std::uint32_t mode = defaults::kSocketModeOfSystem;  // permission bits
  std::string group;  // the group of the file; empty: the process's own
};

// How connections are served.
struct ConnectionOptions {
  // The path of the socket. Not used if socket activation passes sockets.
  std::filesystem::path socket;
  SocketAccess socketAccess;
  // Makes the directory of the socket if its parent exists.
  bool makeSocketDirectory = false;
  BusKind bus = BusKind::kNone;  // open() fails if the service cannot join it
  // The bus that started the service. The service joins this bus, too, unless it is `bus`. A
  // failure is only logged, because a process inherits this value if a bus has started one of its
  // ancestors, and that bus may not be meant for the service.
  std::optional<StarterBus> starter;
  std::string busName = "com.tarno.halvox.reporting";
  std::chrono::milliseconds handshakeTimeout{defaults::kHandshakeTimeout};
  std::chrono::milliseconds messageTimeout{defaults::kMessageTimeout};
  std::uint64_t clientHistoryMegabytes = defaults::kClientHistoryMegabytes;  // 2^20 bytes each
  std::uint64_t clientSessions = defaults::kClientSessions;
  std::uint64_t messageReporterIDs =
      defaults::kMessageReporterIDs;  // the most that one request may name
  std::size_t maxFrameBytes = 32 * kMiB;
  EndSignals signals = EndSignals::kHandle;
  // Called on the I/O thread. `beginBatch` comes before the first delivery of a turn, `endBatch`
  // after the last delivery, and `afterReplies` after the replies of the turn have been written.
  // Replies given on this thread during `endBatch` are replies of the turn. These functions connect
  // the loop to the queues, which the loop itself does not know.
  std::function<void()> beginBatch;
  std::function<void()> endBatch;
  std::function<void()> afterReplies;
  // Called on the I/O thread at SIGUSR1, if `signals` is kHandle.
  std::function<void()> onReportSignal;
  // Called on the I/O thread, if the service manager has a watchdog for this process. Returns false
  // if the service is stuck since the last call although the I/O thread runs. The manager then gets
  // no keep-alive messages.
  std::function<bool()> hasProgressed;
  // Called on the I/O thread for each client that asks for the counters. Returns the value of each
  // counter by "piece, name". Without it the service answers with no counters.
  std::function<Dictionary()> counters;
  StorageControl storage{};
};

// Why open() failed. The message of the failure is one line for the user.
enum class ConnectionOpenError : std::uint8_t {
  kPathTooLong,
  kDirectoryMissing,
  kDirectoryNotWritable,
  kAlreadyServed,  // another process answers on that socket
  kNotASocket,     // a file of another kind exists at the path
  kUnknownGroup,   // the socket's group does not exist
  kNotPermitted,   // the user may not give the file to that group
  kBadActivation,  // a passed descriptor is not a listening stream socket
  kBusUnreachable,
  kBusNameTaken,
  kSystem,  // any other system error
};

// Connections over D-Bus: on a Unix socket of the service's own, on a bus if configured, and on the
// bus that started the process.
//
//   made --open()--> open --the listener's resume()--> serving --requestStop() or a signal--> ended
//
// The thread that calls resume() is the I/O thread. It does all input and output, and calls the
// delegate, the handlers and the methods of exported objects. It never waits for a client: if a
// client does not read its replies, the service stops reading that client's requests. An idle
// service makes no wake-ups.
//
// If a bus is lost, the connections of its senders are invalidated, and the socket continues to be
// served. When the service ends, it does not call the handlers of open connections. Owned by the
// platform.
class LinuxConnectionService final : public ConnectionService {
 public:
  // Construct this object before the first thread starts: it blocks the signals that the loop
  // reads, and only threads that start later inherit the mask. Sets the relief handler of
  // `backpressure`, which must outlive it. The platform's services must be installed before open().
  LinuxConnectionService(ConnectionOptions options, Backpressure& backpressure);
  LinuxConnectionService(const LinuxConnectionService&) = delete;
  LinuxConnectionService& operator=(const LinuxConnectionService&) = delete;
  ~LinuxConnectionService() override;

  // Makes the socket, or takes the sockets of socket activation, and joins the buses. Replaces a
  // socket file on which no process listens any more. Waits at most 5 seconds for each bus. Raises
  // the process's limit of descriptors to the hard limit.
  Result<void, ConnectionOpenError> open();

  NSXPCListener& serviceListener() override;

  // Makes resume() return at the end of the current turn of the loop. Any thread may call it.
  void requestStop();

 private:
  std::unique_ptr<ConnectionHost> host_;
};

}  // namespace halvox::platform::linux_
