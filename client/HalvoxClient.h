#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

namespace halvox::client {

using platform::Dictionary;
using platform::Value;

using ReporterID = std::int64_t;
using Category = std::uint32_t;
using EventType = std::uint16_t;
using ServiceType = std::uint16_t;

// Why a request got no answer of its own.
struct Failure {
  enum class Kind : std::uint8_t {
    kNoService,  // nobody serves the socket, or the connection ended before the answer
    kRefused,    // the service answered with an error
    kTimedOut,
    kBadRequest,  // the request could not be put on the wire (a value it has no form for, too
                  // large)
  };
  Kind kind = Kind::kNoService;
  std::string name;     // the D-Bus error name, when the service gave one
  std::string message;  // one line for a person
};

template <typename T>
struct Result {
  std::optional<T> value;
  std::optional<Failure> failure;
  explicit operator bool() const { return !failure.has_value(); }
};

struct Options {
  // Where the service listens; empty: the first of the usual places that has a service. These are
  // $HALVOX_SOCKET alone when it is set, else the user's, $XDG_RUNTIME_DIR/halvox/reporting.sock,
  // then the system's, /run/halvox/reporting.sock.
  std::string socketPath;
  // What may wait for the client's thread: sends past either bound are dropped and counted.
  std::size_t maxPendingMessages = 8192;
  std::size_t maxPendingBytes = 8U << 20U;
  // How long a synchronous request waits.
  std::chrono::milliseconds requestTimeout{5000};
  // First and longest pause between attempts to reach a service that is not there.
  std::chrono::milliseconds reconnectMin{50};
  std::chrono::milliseconds reconnectMax{2000};
  // How long a client whose connection ended looks for a service at the same place only. A service
  // that starts again must not lose its clients to another one meanwhile.
  std::chrono::milliseconds samePlaceFor{10'000};
};

// What became of the messages that were handed over.
// accepted = acknowledged + refused + lost + pending.
struct Counters {
  std::uint64_t accepted = 0;      // taken by send()
  std::uint64_t dropped = 0;       // not taken: the hand-off was full or the client was closing
  std::uint64_t acknowledged = 0;  // answered by the service
  std::uint64_t refused = 0;       // answered with an error, or without a form on the wire
  // In flight when a connection ended: the service may have had them, so they are not sent again.
  // Also what waited when more than 8,192 session operations had piled up without a service.
  std::uint64_t lost = 0;
  std::uint64_t pending = 0;  // waiting or in flight
  std::uint64_t reconnects = 0;
};

// A program's link to the reporting service.
//
// One thread of its own does all the talking: every operation below is a hand-off to it, in order,
// and the requests are pipelined. When the service goes away the client waits for it to come back,
// connects again and makes its sessions again: created, typed, configured and, if they were
// running, started. Messages handed over meanwhile wait, up to the bounds.
//
// Any thread may call. send() never blocks, locks for long or waits for the service, so an audio
// thread may call it; it does allocate when the message does. The other operations may wait for a
// lock for a moment. Destruction delivers what is pending for at most a second and ends the thread.
//
// The numbers that categories, types and services stand for are in client/Vocabulary.h. A client
// does not work in a process that was forked off its own. Making one throws std::system_error or
// std::bad_alloc when there is no thread or no memory to be had.
class HalvoxClient {
 public:
  explicit HalvoxClient(Options options = {});
  ~HalvoxClient();
  HalvoxClient(const HalvoxClient&) = delete;
  HalvoxClient& operator=(const HalvoxClient&) = delete;

  // Session operations, in the order of a session's life. They return at once; what the service
  // answers to them is logged by nobody: a session that the service does not have is not an error.
  void createSession(ReporterID id);
  void setServiceType(ReporterID id, ServiceType type);
  void setConfiguration(ReporterID id, Dictionary configuration);
  void start(ReporterID id);
  void stop(ReporterID id);
  void destroySession(ReporterID id);

  // Hands one message over for that session. False when it was dropped; see counters().
  bool send(ReporterID id, Dictionary message, Category category, EventType type);
  // The same for several sessions, or with no list at all for all active ones.
  bool send(std::optional<std::vector<ReporterID>> ids, Dictionary message, Category category,
            EventType type);

  // Waits until everything handed over before has been answered or lost, or until the time is up
  // (false). False at once on the client's own thread, and when the client is being destroyed.
  bool flush(std::chrono::milliseconds timeout);
  [[nodiscard]] bool isConnected() const;
  // The socket of the present or last connection; empty before the first one.
  [[nodiscard]] std::string socketPath() const;
  [[nodiscard]] Counters counters() const;
  // Called on the client's thread whenever the connection is made (true) or lost (false), and soon
  // with true when it is made already. An empty one ends that, except for a call that is under way;
  // none comes after the client's destruction.
  void setConnectionHandler(std::function<void(bool connected)> handler);

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

// One connection that asks and waits, for tools: each operation sends one request and returns its
// answer. Belongs to one thread. Does not reconnect.
class HalvoxConnection {
 public:
  // Connects to the socket (empty: as in Options) or says why it cannot, naming every place that
  // was tried.
  static Result<std::unique_ptr<HalvoxConnection>> open(
      const std::string& socketPath, std::chrono::milliseconds timeout = std::chrono::seconds(5));
  ~HalvoxConnection();
  HalvoxConnection(const HalvoxConnection&) = delete;
  HalvoxConnection& operator=(const HalvoxConnection&) = delete;

  // The socket it is connected to.
  [[nodiscard]] const std::string& socketPath() const;
  // Sockets of places before that, which are there but which nobody serves.
  [[nodiscard]] std::vector<std::string> unservedSockets() const;

  Result<bool> createReportingSession(ReporterID id);
  Result<bool> setServiceType(ServiceType type, ReporterID id);
  Result<ServiceType> getServiceNameForReporterID(ReporterID id);
  Result<bool> setConfiguration(const Dictionary& configuration, ReporterID id);
  // The service answers a start when the session is stopped, so this does not wait for it: it
  // returns once the service has carried the start out (a query behind it has been answered).
  Result<bool> startReportingSessionForID(ReporterID id);
  // Waits for the answer to the last start of that session, at most for the time-out.
  Result<bool> waitForStartReply(ReporterID id, std::chrono::milliseconds timeout);
  Result<bool> sendMessage(const Dictionary& message, Category category, EventType type,
                           const std::optional<std::vector<ReporterID>>& ids);
  Result<bool> stopReportingSessionForID(ReporterID id);
  Result<bool> destroyReportingSession(ReporterID id);
  Result<Dictionary> reporterIDValid(ReporterID id);
  Result<std::vector<ReporterID>> getAllReporters();
  // The service ends without an answer; true when the connection ended. Refused unless this process
  // is root's or that of the user whom the service runs as.
  Result<bool> killService();

 private:
  class Impl;
  explicit HalvoxConnection(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

// Where a client with default settings looks for the service now: $HALVOX_SOCKET, else
// $XDG_RUNTIME_DIR/halvox/reporting.sock if that exists, else /run/halvox/reporting.sock if that
// exists, else the first of these that is set. Does not connect.
std::string defaultSocketPath();

}  // namespace halvox::client
