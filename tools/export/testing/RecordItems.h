#pragma once

#include <string>
#include <string_view>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/export/RecordWriter.h"

// Records for the tests of the exports, one of each kind. Texts are literals.
namespace halvox::tools {

[[nodiscard]] inline platform::linux_::StoredItem eventItem(std::string_view payload,
                                                            std::string_view application = "") {
  platform::linux_::StoredItem item;
  item.id = 8;
  item.time = 1'700'000'000.25;
  item.name = "com.tarno.halvox.Session_Playback.Start";
  item.application = application;
  item.payload = payload;
  return item;
}

[[nodiscard]] inline platform::linux_::StoredItem linkItem(std::string_view payload,
                                                           std::int64_t sessionID = -1) {
  platform::linux_::StoredItem item;
  item.table = &platform::linux_::kLinkMessages;
  item.id = 9;
  item.time = 1'700'000'001;
  item.sessionID = sessionID;
  item.clientName = "com.tarno.halvox";
  item.serviceName = "longformaudio_session";
  item.number = 4;
  item.type = 1;
  item.payload = payload;
  return item;
}

[[nodiscard]] inline platform::linux_::StoredItem metricItem(std::string_view message) {
  platform::linux_::StoredItem item;
  item.table = &platform::linux_::kIssueMetrics;
  item.id = 3;
  item.time = 1'700'000'002;
  item.number = 0x5B0003;
  item.payload = message;
  return item;
}

[[nodiscard]] inline platform::linux_::StoredItem powerItem(std::string_view payload) {
  platform::linux_::StoredItem item;
  item.table = &platform::linux_::kPowerEvents;
  item.id = 4;
  item.time = 1'700'000'003;
  item.number = 28;
  item.name = "Oxbow_Haptics";
  item.payload = payload;
  return item;
}

[[nodiscard]] inline platform::linux_::StoredItem snapshotItem(std::string_view signature) {
  platform::linux_::StoredItem item;
  item.table = &platform::linux_::kSnapshots;
  item.id = 5;
  item.time = 1'700'000'004;
  item.payload = signature;
  item.path = "/var/lib/halvox/a, b.tar";
  return item;
}

[[nodiscard]] inline platform::linux_::StoredItem lossItem(std::string_view reason) {
  platform::linux_::StoredItem item;
  item.table = &platform::linux_::kLosses;
  item.id = 6;
  item.time = 1'700'000'005;
  item.name = "link local";
  item.payload = reason;
  item.number = 12;
  return item;
}

// The whole text of an export of these records.
template <typename... Items>
std::string written(RecordWriter& writer, const Items&... items) {
  std::string text;
  writer.begin(text);
  (writer.add(items, text), ...);
  writer.finish(text);
  return text;
}

}  // namespace halvox::tools
