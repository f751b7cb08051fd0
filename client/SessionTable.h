#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

namespace halvox::client {

// One step of a session's life, as the service is asked for it.
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

// What a service that carried out a row of operations has: its sessions with their type,
// configuration and whether they run. A new service is brought to the same by remake().
// Plain data, belongs to whoever holds it. Grows with the program's own sessions only.
class SessionTable {
 public:
  // Follows the service's rules: creating again replaces, configurations are merged, operations on
  // a session that is not there do nothing.
  void apply(const SessionOperation& operation);
  // The operations that make all these sessions, in the order in which they were first created.
  [[nodiscard]] std::vector<SessionOperation> remake() const;
  [[nodiscard]] std::size_t size() const { return sessions_.size(); }

 private:
  struct Session {
    std::size_t order = 0;
    std::optional<ServiceType> type;
    Dictionary configuration;
    bool running = false;
  };
  std::map<ReporterID, Session> sessions_;
  std::size_t created_ = 0;
};

}  // namespace halvox::client
