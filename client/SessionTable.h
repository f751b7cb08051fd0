#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

namespace halvox::client {

// One step of a session's life, which is one request to the service.
struct CreateSession {};
struct DestroySession {};
struct StartSession {};
struct StopSession {};
using SessionStep =
    std::variant<CreateSession, ServiceType, Dictionary, StartSession, StopSession, DestroySession>;
struct SessionOperation {
  ReporterID id = 0;
  SessionStep step;
};

// The state of a service after a sequence of operations: its sessions, with their types and
// configurations, and which of them run. remake() returns the operations that bring a new service
// to the same state. Plain data; the owner provides locking. Grows only with the program's own
// sessions.
class SessionTable {
 public:
  // Applies an operation by the rules of the service: creating a session again replaces it,
  // configurations are merged, and operations on an unknown session do nothing.
  void apply(const SessionOperation& operation);
  // Returns the operations that make all these sessions, in the order of their creation.
  [[nodiscard]] std::vector<SessionOperation> remake() const;
  [[nodiscard]] std::size_t size() const { return sessions_.size(); }
  // Returns the number of sessions that are started and not stopped.
  [[nodiscard]] std::size_t running() const { return running_; }

 private:
  struct Session {
    std::size_t order = 0;
    std::optional<ServiceType> type;
    Dictionary configuration;
    bool running = false;
  };
  void setRunning(Session& session, bool running);

  std::map<ReporterID, Session> sessions_;
  std::size_t running_ = 0;
  std::size_t created_ = 0;
};

}  // namespace halvox::client
