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
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/configuration/Defaults.h"
#include "platform/linux/connection/BusAddress.h"
#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/dispatch/Backpressure.h"

namespace halvox::platform::linux_ {

class ConnectionHost;
class ListeningSocket;

// Whether SIGTERM and SIGINT end the listener's resume().
enum class EndSignals : std::uint8_t { kHandle, kLeaveAlone };

// Who may connect to the socket's file.
struct SocketAccess {
  std::uint32_t mode = defaults::kSocketModeOfSystem;  // permission bits
  std::string group;  // the file is given to this group; empty: left as it is made
};

// How connections are served.
struct ConnectionOptions {
  // These two are not used when the service is started through a socket.
  std::filesystem::path socket;
  SocketAccess socketAccess;
  // Makes the directory of the socket, if it alone is missing.
  bool makeSocketDirectory = false;
  BusKind bus = BusKind::kNone;  // nothing is served when it cannot be joined
  // Joined too, unless it is `bus`. When that fails, the rest is served all the same: whatever a
  // bus starts has this in its environment, and so have the programs that are started from there.
  std::optional<StarterBus> starter;
  std::string busName = "com.tarno.halvox.reporting";
  std::chrono::milliseconds handshakeTimeout{defaults::kHandshakeTimeout};
  std::chrono::milliseconds messageTimeout{defaults::kMessageTimeout};
  std::uint64_t clientHistoryMegabytes = defaults::kClientHistoryMegabytes;  // 2^20 bytes each
  std::uint64_t clientSessions = defaults::kClientSessions;
  std::uint64_t messageReporterIDs = defaults::kMessageReporterIDs;  // named by one request
  std::size_t maxFrameBytes = 32 * kMiB;
  EndSignals signals = EndSignals::kHandle;
  // Called on the I/O thread before the first delivery of a turn, after the last one, and once the
  // replies of the turn are written. A reply that is given on this thread during `endBatch` is
  // among them.
  std::function<void()> beginBatch;
  std::function<void()> endBatch;
  std::function<void()> afterReplies;
  // Called on the I/O thread at SIGUSR1, when the signals are handled.
  std::function<void()> onReportSignal;
};

// Why nothing can be served.
struct ConnectionOpenError {
  enum class Kind : std::uint8_t {
    kPathTooLong,
    kDirectoryMissing,
    kDirectoryNotWritable,
    kAlreadyServed,  // somebody answers on that socket
    kNotASocket,     // a file of another kind is in the way
    kUnknownGroup,   // the socket's group does not exist
    kNotPermitted,   // the socket's file may not be given to its group
    kBadActivation,  // a descriptor that was passed is no listening stream socket
    kBusUnreachable,
    kBusNameTaken,
    kSystem,  // anything else that the system refused
  };
  Kind kind = Kind::kSystem;
  std::string description;  // one line for the user, naming the object and the system's error
};

// Connections over D-Bus: peer to peer on a Unix socket of its own, on a bus when asked to, and on
// the bus that started the process.
//
// One thread, the one that calls resume() of the listener, carries out all input and output, runs
// the delegate, the handlers and the requests. It never waits for a client: what a client does not
// read is bounded and only its own requests wait for it. An idle service makes no wake-ups.
//
// When the bus is lost, its senders are invalidated and the socket is served on.
// At the end the handlers of connections that are still there are not called.
class LinuxConnectionService final : public ConnectionService {
 public:
  // Make it before the first thread starts: it takes the end signals from all threads to come, and
  // the relief of `backpressure`, which must outlive it. Platform services must be installed when
  // open() is called.
  LinuxConnectionService(ConnectionOptions options, Backpressure& backpressure);
  LinuxConnectionService(const LinuxConnectionService&) = delete;
  LinuxConnectionService& operator=(const LinuxConnectionService&) = delete;
  ~LinuxConnectionService() override;

  // Makes the socket, or takes the ones passed at start, and connects to the buses. A socket file
  // that nobody serves any more is replaced. May wait for each bus, a few seconds at most. Lets
  // the process have as many descriptors as it may.
  [[nodiscard]] std::optional<ConnectionOpenError> open();

  NSXPCListener& serviceListener() override;

  // Lets resume() return at the end of its turn. Any thread.
  void requestStop();

 private:
  std::unique_ptr<ConnectionHost> host_;
};

}  // namespace halvox::platform::linux_
