#include <algorithm>
#include <memory>
#include <utility>

#include "backends/PrivacyFilter.h"
#include "platform/diagnostic_reporter.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegate.h"
#include "service/ReportingQueue.h"

namespace halvox {
namespace {

// At most this many sessions and clients are described. Describing more would delay requests, since
// the description is made on the reporting queue.
constexpr std::size_t kMostDescribed = 5000;
constexpr std::size_t kMostClients = 5000;

platform::Dictionary describeClient(const HVReportingClientServerInstance& client,
                                    std::size_t& room) {
  platform::Dictionary state{{"pid", client.processIdentifier()}};
  if (const auto name = client.clientProcessName()) state.set("process_name", *name);
  if (const auto start = client.clientStartDate()) state.set("start_date", *start);
  const auto& sessions = client.clientReportingSessionMap();
  std::vector<platform::Value> described;
  described.reserve(std::min(room, sessions.size()));
  for (const auto& [id, session] : sessions) {
    if (room == 0) break;
    --room;
    described.emplace_back(session->description());
  }
  state.set("session_count", static_cast<std::uint64_t>(sessions.size()));
  state.set("sessions", platform::Array(described));
  applyPrivacy(state);
  return state;
}

}  // namespace

// The description is made by a job of the reporting queue, because nothing else changes clients and
// sessions meanwhile.
void HVReportingServiceDelegate::offerState() {
  platform::diagnosticReporters().setStateSource(
      [this, alive = std::weak_ptr<const bool>(alive_)](
          std::function<void(const platform::Dictionary&)> callback) {
        reportingQueue()->async(platform::JobWeight::kMayBlock,
                                [this, alive, callback = std::move(callback)] {
                                  if (!alive.expired()) callback(describeState());
                                });
      });
}

platform::Dictionary HVReportingServiceDelegate::describeState() const {
  // Every client is counted even if it is not described: a capture must show that something is
  // missing.
  std::size_t room = kMostDescribed;
  std::uint64_t sessions = 0;
  std::vector<platform::Value> described;
  for (const Client& client : clients_) {
    sessions += client->clientReportingSessionMap().size();
    if (described.size() < kMostClients) described.emplace_back(describeClient(*client, room));
  }
  return {{"reporting_enabled", isReportingEnabled()},
          {"active_session_count", activeSessionCount()},
          {"client_count", static_cast<std::uint64_t>(clients_.size())},
          {"session_count", sessions},
          {"sessions_described", static_cast<std::uint64_t>(kMostDescribed - room)},
          {"clients", platform::Array(described)}};
}

}  // namespace halvox
