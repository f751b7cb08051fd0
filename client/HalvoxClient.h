#pragma once

/// @file
/// The client of the Halvox reporting service, for C++.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

/// The client of the Halvox reporting service.
namespace halvox::client {

class EncodedDictionary;

using platform::Dictionary;
using platform::Value;

/// The number of a session, chosen by the program that creates it. 0 means no session.
using ReporterID = std::int64_t;
/// @{
/// What a message is about, what happened, and what kind of audio a session is for.
/// client/Vocabulary.h has names for the values.
using Category = std::uint32_t;
using EventType = std::uint16_t;
using ServiceType = std::uint16_t;
/// @}

/// Why a request has no result.
struct Failure {
  /// The kinds of failure.
  enum class Kind : std::uint8_t {
    kNoService,   ///< no service listens, or the connection ended before the answer
    kRefused,     ///< the service answered with an error
    kTimedOut,    ///< no answer within the time-out; the request may have been carried out
    kBadRequest,  ///< the wire cannot hold the request: a text that is not UTF-8, or too large
  };
  Kind kind = Kind::kNoService;  ///< what went wrong
  std::string name;              ///< the D-Bus error name; empty if the service gave none
  std::string message;           ///< one line for a person
};

/// Has either a value or a failure, never both. Converts to true if there is a value.
template <typename T>
struct Result {
  std::optional<T> value;          ///< the answer
  std::optional<Failure> failure;  ///< why there is no answer
  /// Returns true if there is a value.
  explicit operator bool() const { return !failure.has_value(); }
};

/// How a client works.
struct Options {
  /// The socket of the service. If this path is empty, the client tries the usual places: only
  /// $HALVOX_SOCKET if that is set; otherwise the user's service,
  /// $XDG_RUNTIME_DIR/halvox/reporting.sock, then the system's service, /run/halvox/reporting.sock.
  /// It uses the first place at which a service listens.
  std::string socketPath;
  /// @{
  /// The bounds of the messages that wait for the client's thread: their number and their bytes of
  /// memory. A message takes the size of its body on the wire plus 8 bytes, rounded up to a
  /// multiple of 512. When either bound is reached, send() drops the message and counts it. Larger
  /// values than 16,777,216 messages and 1 GiB count as these. With the defaults, 8,192 messages of
  /// ten fields can wait, and a message may have nearly 4 MiB. In a program that has called
  /// mlockall(MCL_FUTURE), all of these bytes are resident.
  std::size_t maxPendingMessages = 8192;
  std::size_t maxPendingBytes = 4U << 20U;
  /// @}
  /// The longest time that making a connection may take.
  std::chrono::milliseconds requestTimeout{5000};
  /// @{
  /// The first and the longest pause between attempts to connect. Pauses grow from one to the
  /// other.
  std::chrono::milliseconds reconnectMin{50};
  std::chrono::milliseconds reconnectMax{2000};
  /// @}
  /// After a connection has ended, the client tries only the same place for this long. A service
  /// that is being restarted must not lose its clients to a service at another place.
  std::chrono::milliseconds samePlaceFor{10'000};
  /// For programs that send from audio threads. If true, the client's thread looks for messages by
  /// itself while a session runs, and send() never makes a system call to wake it. The thread looks
  /// up to a thousand times a second, and a hundred times a second if no messages come.
  bool isRealTime = false;
};

/// The number of messages for each outcome: accepted = acknowledged + refused + lost + pending.
struct Counters {
  std::uint64_t accepted = 0;  ///< send() returned true
  std::uint64_t dropped = 0;   ///< send() returned false: a bound is reached, or the client ends
  /// Answered by the service without an error, or taken by it when it ended in an orderly way.
  std::uint64_t acknowledged = 0;
  std::uint64_t refused = 0;  ///< answered with an error, or not representable on the wire
  /// Sent but not answered when the service crashed. The client does not send these messages again,
  /// because the service may have received them. Also counts the messages that were discarded
  /// because 8,192 session operations were waiting without a service.
  std::uint64_t lost = 0;
  std::uint64_t pending = 0;     ///< waiting or in flight
  std::uint64_t reconnects = 0;  ///< connections made after the first one
};

/// A program's connection to the reporting service, for programs that must not wait for the
/// service.
///
/// The client has one thread, which exchanges all messages with the service. The operations below
/// pass work to that thread, in order. The thread sends further requests before earlier ones are
/// answered. If the service ends, the client waits for a new service and connects to it. It then
/// creates its sessions again with their types and configurations, and starts those that were
/// running. Until then messages wait, up to the bounds.
///
/// When a service ends in an orderly way, as in a restart, it tells its clients which of their
/// requests it has taken. The client sends the others to the next service, and every message
/// arrives exactly once. When a service crashes, the messages that it has not answered are lost.
///
/// Any thread may call these functions. send() encodes the message on the caller's thread, and
/// keeps no reference to it. An audio thread may call send(), because it never blocks, takes no
/// lock, allocates nothing and does not wait for the service. If no message was sent for 50 ms,
/// send() makes one system call, to wake the client's thread. With Options::isRealTime it makes
/// none while a session runs. The other operations may wait for a lock for a moment. After fork(),
/// a client works only in the process that made it. In a child process flush() returns false at
/// once, and destruction leaves the connection to the parent.
///
/// The caller owns the client. Construction does not wait for the service and succeeds without one.
/// It throws std::system_error if the thread cannot be started, and std::bad_alloc if there is not
/// enough memory. Destruction delivers pending messages for at most one second if the service is
/// there, then ends the thread.
class HalvoxClient {
 public:
  /// Starts the client's thread.
  explicit HalvoxClient(Options options = {});
  ~HalvoxClient();
  HalvoxClient(const HalvoxClient&) = delete;
  HalvoxClient& operator=(const HalvoxClient&) = delete;

  /// @name The steps of a session's life, in their order
  /// These functions return at once. A step for a session that the service does not know has no
  /// effect, and the service reports no error.
  /// @{
  /// Makes a session. It replaces an older one of this client with the same ID.
  void createSession(ReporterID id);
  /// Says what kind of audio the session is for.
  void setServiceType(ReporterID id, ServiceType type);
  /// Merges a dictionary into the session's configuration.
  void setConfiguration(ReporterID id, Dictionary configuration);
  /// Starts reporting for the session.
  void start(ReporterID id);
  /// Stops the session, which may be started again.
  void stop(ReporterID id);
  /// Removes the session, and stops it first if it runs.
  void destroySession(ReporterID id);
  /// @}

  /// Passes one message for a session to the client's thread. The session may belong to another
  /// client. Returns false if the message was dropped; see counters().
  bool send(ReporterID id, const Dictionary& message, Category category, EventType type);
  /// @{
  /// Does the same for several sessions. Without a list, the message is for all started sessions of
  /// all programs.
  bool send(const std::optional<std::vector<ReporterID>>& ids, const Dictionary& message,
            Category category, EventType type);
  bool sendTo(std::span<const ReporterID> ids, const Dictionary& message, Category category,
              EventType type);
  /// @}
  /// @{
  /// These functions do the same for a message in its encoded form (client/EncodedDictionary.h).
  /// They copy its bytes and encode nothing.
  bool send(ReporterID id, const EncodedDictionary& message, Category category, EventType type);
  bool sendTo(std::span<const ReporterID> ids, const EncodedDictionary& message, Category category,
              EventType type);
  bool sendToAll(const EncodedDictionary& message, Category category, EventType type);
  /// @}

  /// Blocks until all operations and messages before this call have been answered or lost. If the
  /// client's thread is asleep, the calling thread itself sends and receives for up to two
  /// milliseconds. Returns false after the time-out, or if the client is being destroyed. On the
  /// client's own thread, returns false at once.
  bool flush(std::chrono::milliseconds timeout);
  /// Returns true while a connection to the service exists. Never blocks.
  [[nodiscard]] bool isConnected() const;
  /// Returns the socket of the current or last connection; empty before the first one.
  [[nodiscard]] std::string socketPath() const;
  /// Returns the current counters. Never blocks.
  [[nodiscard]] Counters counters() const;
  /// Sets the function that the client calls when the connection is made (true) or lost (false). If
  /// there is a connection already, the client calls it soon with true. An empty function removes
  /// the handler. The handler runs on the client's thread, which sends nothing until the handler
  /// returns. The handler must not block or destroy the client. If the handler is replaced while it
  /// runs, that call may end after this function has returned. The client does not call it after
  /// its destruction.
  void setConnectionHandler(std::function<void(bool connected)> handler);

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

/// A connection for tools. Each operation sends one request, waits for the answer, at most for the
/// time-out given to open(), and returns the answer. Belongs to one thread. Does not reconnect:
/// after the connection has ended, every request fails with kNoService. Destruction closes the
/// connection, and the service then ends the sessions of this connection.
///
/// If the service does not know the session of a request, it answers with true or default values,
/// not with an error.
class HalvoxConnection {
 public:
  /// Connects to a socket. An empty path stands for the usual places; see Options::socketPath. The
  /// failure names every place that was tried. Blocks for at most `timeout`.
  static Result<std::unique_ptr<HalvoxConnection>> open(
      const std::string& socketPath, std::chrono::milliseconds timeout = std::chrono::seconds(5));
  ~HalvoxConnection();
  HalvoxConnection(const HalvoxConnection&) = delete;
  HalvoxConnection& operator=(const HalvoxConnection&) = delete;

  /// Returns the socket of this connection.
  [[nodiscard]] const std::string& socketPath() const;
  /// Returns the sockets that open() tried before and on which no service listens although they
  /// exist.
  [[nodiscard]] std::vector<std::string> unservedSockets() const;

  /// Makes a session. It replaces an older one of this connection with the same ID.
  Result<bool> createReportingSession(ReporterID id);
  /// Says what kind of audio the session is for.
  Result<bool> setServiceType(ServiceType type, ReporterID id);
  /// Despite its name, returns the service type of a session; 65535 for an unknown session.
  Result<ServiceType> getServiceNameForReporterID(ReporterID id);
  /// Merges a dictionary into the session's configuration.
  Result<bool> setConfiguration(const Dictionary& configuration, ReporterID id);
  /// Returns when the service has carried out the start. The service answers the start itself only
  /// at the stop. This function therefore sends a query after the start and waits for the answer to
  /// the query.
  Result<bool> startReportingSessionForID(ReporterID id);
  /// Blocks until the last start of that session is answered, at most for `timeout`.
  Result<bool> waitForStartReply(ReporterID id, std::chrono::milliseconds timeout);
  /// Without a list of IDs, the message is for all started sessions of all programs.
  Result<bool> sendMessage(const Dictionary& message, Category category, EventType type,
                           const std::optional<std::vector<ReporterID>>& ids);
  /// Stops the session, which may be started again.
  Result<bool> stopReportingSessionForID(ReporterID id);
  /// Removes the session, and stops it first if it runs.
  Result<bool> destroyReportingSession(ReporterID id);
  /// Returns "reporterID" and "serviceType" of a session; 0 and 65535 for an unknown one.
  Result<Dictionary> reporterIDValid(ReporterID id);
  /// Returns the IDs of the sessions of all clients.
  Result<std::vector<ReporterID>> getAllReporters();
  /// Returns what the service has counted since its start: the number of each counter by "piece,
  /// name", such as "session, suppressed: redundant". A service of an earlier version refuses.
  Result<Dictionary> getCounters();
  /// Begins to delete stored records: "before" (seconds since 1970) and "to" (bytes) say which.
  /// Only root and the user that the service runs as may do this; others are refused.
  Result<bool> beginVacuum(const Dictionary& options);
  /// Returns how the vacuum is getting on, or how the last one ended. For the same users.
  Result<Dictionary> vacuumState();
  /// Begins to erase what the service stored: of the application "app", of the session "session",
  /// or everything "before" a time (seconds since 1970). Exactly one of them. For the same users.
  Result<bool> beginErase(const Dictionary& options);
  /// Returns how the erasure is getting on, or how the last one ended. For the same users.
  Result<Dictionary> eraseState();
  /// Ends the service. The service does not answer this request. The result true means that the
  /// connection has ended. Only root and the user that the service runs as may do this; others are
  /// refused.
  Result<bool> killService();

 private:
  class Impl;
  explicit HalvoxConnection(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

/// Returns the socket where a client with default options looks for the service now. This is
/// $HALVOX_SOCKET if it is set, or else the first of $XDG_RUNTIME_DIR/halvox/reporting.sock and
/// /run/halvox/reporting.sock that exists. If neither exists, it is the first of these two that is
/// defined. Does not connect.
std::string defaultSocketPath();

}  // namespace halvox::client
