#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "bench/load/LoadClient.h"
#include "bench/load/Process.h"

namespace halvox::bench {

// The echo, the service with both events of each message stored, the service with none wanted.
enum class ServerKind : std::uint8_t { kEcho, kStored, kUnwanted };

inline constexpr const char* kNoLink = "[link]\nbackend = \"none\"\n";
inline constexpr const char* kLocalLink = "[link]\nbackend = \"local\"\n";

struct ServerPrograms {
  std::string service;
  std::string echo;  // takes "--echo SOCKET"
};

// A server of some kind with a directory of its own, which goes with it.
class Server {
 public:
  // `settings` are tables that are added to the configuration, that of the link among them.
  // them.
  Server(const ServerPrograms& programs, ServerKind kind, const std::string& settings = kNoLink);

  // A client with a started session, and one without any.
  [[nodiscard]] std::unique_ptr<LoadClient> client(std::int64_t reporter) const;
  [[nodiscard]] std::unique_ptr<LoadClient> idleClient() const;
  [[nodiscard]] const Process& process() const { return *process_; }
  [[nodiscard]] std::string database() const { return directory_.path() + "/state/halvox.db"; }

 private:
  [[nodiscard]] std::unique_ptr<Process> start(const ServerPrograms& programs,
                                               const std::string& settings) const;

  ServerKind kind_;
  ScratchDirectory directory_;
  std::string socket_;
  std::unique_ptr<Process> process_;
};

}  // namespace halvox::bench
