#include "analysis/StoreRecordSource.h"

#include <string>

#include "analysis/MessageNames.h"

namespace halvox::analysis {
namespace {

using platform::linux_::Failure;
using platform::linux_::RecordFilter;
using platform::linux_::StoredItem;
namespace store = platform::linux_;

constexpr const char* kApplicationKey = "HostApplicationDisplayID";

// Makes the records of a callback. Owns what they refer to besides the item itself.
class RecordMaker {
 public:
  const Record& make(const StoredItem& item) {
    record_ = {};
    record_.id = item.id;
    record_.time = item.time;
    record_.payload = &payload_;
    const bool hasJson = item.table != &store::kIssueMetrics && item.table != &store::kLosses;
    payload_.show(hasJson ? item.payload : std::string_view());
    if (item.table == nullptr) {
      makeEvent(item);
    } else if (item.table == &store::kLinkMessages) {
      makeLinkMessage(item);
    } else {
      makeOther(item);
    }
    return record_;
  }

 private:
  void makeEvent(const StoredItem& item) {
    record_.kind = RecordKind::kEvent;
    record_.name = item.name;
    const EventNameParts parts = splitEventName(item.name);
    record_.service = parts.service;
    record_.category = parts.category;
    record_.type = parts.type;
    record_.application = item.application;
    // A service of an earlier version stored the application only in the payload.
    if (record_.application.empty()) {
      record_.application = payload_.text(kApplicationKey).value_or(std::string_view());
    }
  }

  void makeLinkMessage(const StoredItem& item) {
    record_.kind = RecordKind::kLinkMessage;
    record_.service = linkServiceType(item.serviceName);
    record_.sessionID = item.sessionID;
    names_ = linkMessageNames(item.number, item.type, payload_);
    record_.category = names_.category;
    record_.type = names_.type;
  }

  void makeOther(const StoredItem& item) {
    record_.number = item.number;
    if (item.table == &store::kIssueMetrics) {
      record_.kind = RecordKind::kIssueMetric;
      record_.bytes = item.payload;
    } else if (item.table == &store::kPowerEvents) {
      record_.kind = RecordKind::kPowerEvent;
      record_.name = item.name;
    } else if (item.table == &store::kLosses) {
      record_.kind = RecordKind::kLoss;
      record_.name = item.name;
      record_.reason = item.payload;
    } else {
      record_.kind = RecordKind::kSnapshot;
      record_.path = item.path;
    }
  }

  Record record_;
  Payload payload_;
  LinkMessageNames names_;
};

}  // namespace

store::Result<void> StoreRecordSource::forEach(const RecordRange& range, const Callback& callback) {
  RecordFilter filter;
  filter.since = range.since;
  filter.until = range.until;
  filter.after = range.after;
  RecordMaker maker;
  const auto read =
      reader_.forEachItem({.messages = range.messages,
                           .metrics = range.metrics,
                           .power = range.power,
                           .snapshots = range.snapshots,
                           .losses = range.losses},
                          filter, [&](const StoredItem& item) { callback(maker.make(item)); });
  if (!read) return Failure<>{read.error().message};
  return {};
}

}  // namespace halvox::analysis
