#include "tools/export/ApplicationFilter.h"

#include <bit>

#include "analysis/IssueMetric.h"

#include "tools/Globs.h"
#include "tools/export/RecordKinds.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoredItem;

constexpr const char* kStampKey = "hvreporting_timestamp";
constexpr const char* kApplicationKey = "HostApplicationDisplayID";
constexpr const char* kPowerApplicationKey = "ApplicationName";

}  // namespace

bool ApplicationFilter::accepts(const StoredItem& item) {
  if (patterns_.empty()) return true;
  payload_.show(item.payload);
  switch (kindOf(item)) {
    case ExportKind::kEvents:
      return acceptsEvent(item);
    case ExportKind::kLink:
      return acceptsLinkMessage(item);
    case ExportKind::kPower:
      return matches(payload_.text(kPowerApplicationKey).value_or(std::string_view()));
    case ExportKind::kMetrics: {
      if (item.number != analysis::kAudioIssueDetected) return false;
      const auto issue = analysis::parseAudioIssue(item.payload);
      return issue && matches(issue->client);
    }
    case ExportKind::kSnapshots:
    case ExportKind::kLosses:
      return false;
  }
  return false;
}

bool ApplicationFilter::matches(std::string_view application) const {
  return matchesAnyGlob(patterns_, std::string(application));
}

bool ApplicationFilter::acceptsEvent(const StoredItem& item) {
  const bool isAccepted =
      matches(!item.application.empty()
                  ? item.application
                  // A service of an earlier version stored the application only in the payload.
                  : payload_.text(kApplicationKey).value_or(std::string_view()));
  if (const auto stamp = payload_.number(kStampKey)) {
    note(std::bit_cast<std::uint64_t>(*stamp), isAccepted);
  }
  return isAccepted;
}

bool ApplicationFilter::acceptsLinkMessage(const StoredItem& item) {
  const auto stamp = payload_.number(kStampKey);
  const auto event = stamp ? stamps_.find(std::bit_cast<std::uint64_t>(*stamp)) : stamps_.end();
  if (event != stamps_.end()) {
    // Sessions that ended long ago are dropped with the others: their next message brings them
    // back.
    if (sessions_.size() >= kMostSessions) sessions_.clear();
    sessions_.insert_or_assign(item.sessionID, event->second);
    return event->second;
  }
  const auto session = sessions_.find(item.sessionID);
  return session != sessions_.end() && session->second;
}

void ApplicationFilter::note(std::uint64_t stamp, bool isAccepted) {
  if (!stamps_.insert_or_assign(stamp, isAccepted).second) return;
  oldest_.push_back(stamp);
  if (oldest_.size() <= kMostStamps) return;
  stamps_.erase(oldest_.front());
  oldest_.pop_front();
}

}  // namespace halvox::tools
