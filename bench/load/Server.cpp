#include "bench/load/Server.h"

#include <fstream>
#include <vector>

namespace halvox::bench {

Server::Server(const ServerPrograms& programs, ServerKind kind, const std::string& settings)
    : kind_(kind), socket_(directory_.path("s")), process_(start(programs, settings)) {
  process_->waitForSocket(socket_);
}

std::unique_ptr<LoadClient> Server::client(std::int64_t reporter) const {
  return std::make_unique<LoadClient>(socket_, reporter, kind_ != ServerKind::kEcho);
}

std::unique_ptr<LoadClient> Server::idleClient() const {
  return std::make_unique<LoadClient>(socket_, 0, false);
}

std::unique_ptr<Process> Server::start(const ServerPrograms& programs,
                                       const std::string& settings) const {
  if (kind_ == ServerKind::kEcho) {
    return std::make_unique<Process>(std::vector<std::string>{programs.echo, "--echo", socket_},
                                     std::vector<std::string>{});
  }
  const std::string config = directory_.path("halvox.toml");
  // The limits are far beyond what a scenario needs: a client that is refused, or a store that
  // deletes old records, would measure something else.
  std::ofstream(config) << "[listener]\nsocket = \"" << socket_ << "\"\n[storage]\ndirectory = \""
                        << directory_.path("state") << "\"\nmax_megabytes = 8192\n"
                        << "[analytics]\nwanted = ["
                        << (kind_ == ServerKind::kStored ? "\"*\"" : "")
                        << "]\n[limits]\nclient_history_megabytes = 65536\n"
                        << "client_sessions = 1000000\n[log]\nlevel = \"error\"\n"
                        << settings;
  return std::make_unique<Process>(std::vector<std::string>{programs.service},
                                   std::vector<std::string>{"HALVOX_CONFIG=" + config});
}

}  // namespace halvox::bench
