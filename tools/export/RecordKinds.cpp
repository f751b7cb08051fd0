#include "tools/export/RecordKinds.h"

namespace halvox::tools {

using platform::linux_::StoredItem;
namespace store = platform::linux_;

bool ExportKinds::has(ExportKind kind) const {
  switch (kind) {
    case ExportKind::kEvents:
      return events;
    case ExportKind::kMetrics:
      return metrics;
    case ExportKind::kPower:
      return power;
    case ExportKind::kLink:
      return link;
    case ExportKind::kSnapshots:
      return snapshots;
    case ExportKind::kLosses:
      return losses;
  }
  return false;
}

ExportKind kindOf(const StoredItem& item) {
  if (item.table == nullptr) return ExportKind::kEvents;
  if (item.table == &store::kIssueMetrics) return ExportKind::kMetrics;
  if (item.table == &store::kPowerEvents) return ExportKind::kPower;
  if (item.table == &store::kLosses) return ExportKind::kLosses;
  return item.table == &store::kLinkMessages ? ExportKind::kLink : ExportKind::kSnapshots;
}

std::string_view wordOf(ExportKind kind) {
  switch (kind) {
    case ExportKind::kEvents:
      return "events";
    case ExportKind::kMetrics:
      return "metrics";
    case ExportKind::kPower:
      return "power";
    case ExportKind::kLink:
      return "link";
    case ExportKind::kSnapshots:
      return "snapshots";
    case ExportKind::kLosses:
      return "losses";
  }
  return {};
}

store::StoredKinds storedKinds(const ExportKinds& kinds) {
  // Events and link messages are in the same blocks.
  return {.messages = kinds.events || kinds.link,
          .metrics = kinds.metrics,
          .power = kinds.power,
          .snapshots = kinds.snapshots,
          .losses = kinds.losses};
}

}  // namespace halvox::tools
