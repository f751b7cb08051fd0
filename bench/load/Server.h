#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "bench/load/LoadClient.h"
#include "bench/load/Process.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::bench {

// The echo; the service, which stores both events of each message; the service without any wanted
// event.
enum class ServerKind : std::uint8_t { kEcho, kStored, kUnwanted };

// The aims of the measurements apply to a service without a link; the default link stores a third
// record for each message.
inline constexpr const char* kNoLink = "[link]\nbackend = \"none\"\n";
inline constexpr const char* kLocalLink = "[link]\nbackend = \"local\"\n";

struct ServerPrograms {
  std::string service;
  std::string echo;  // takes "--echo SOCKET"
};

// Runs a server with its own directory, and deletes the directory afterwards.
class Server {
 public:
  // `settings` is TOML text that is added to the configuration, with the table of the link.
  Server(const ServerPrograms& programs, ServerKind kind, const std::string& settings = kNoLink);

  // Returns a client with a started session, or one without a session.
  [[nodiscard]] std::unique_ptr<LoadClient> client(std::int64_t reporter) const;
  [[nodiscard]] std::unique_ptr<LoadClient> idleClient() const;
  [[nodiscard]] const Process& process() const { return *process_; }
  [[nodiscard]] std::string database() const { return directory_.path("state/halvox.db"); }

 private:
  [[nodiscard]] std::unique_ptr<Process> start(const ServerPrograms& programs,
                                               const std::string& settings) const;

  ServerKind kind_;
  platform::linux_::ScratchDirectory directory_;
  std::string socket_;
  std::unique_ptr<Process> process_;
};

}  // namespace halvox::bench
