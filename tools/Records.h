#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/RowPrinter.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

// A request for stored records of any kind but events.
struct ShowRecords {
  enum class Kind : std::uint8_t { kMetrics, kPower, kLink, kSnapshots };
  Kind kind = Kind::kLink;
  RecordSelection selection{};  // names of power events, or of services for link messages
  // Only records with one of these numbers; an empty list stands for all.
  std::vector<std::int64_t> ids{};  // of metrics, or of sessions for link messages
  // Categories of power events, or of link messages with their domains. A category without a domain
  // stands for all domains.
  std::vector<std::int64_t> categories{};
  std::vector<std::int64_t> types{};
};

// The columns of a record after its time. Shows the fields of a metric that it knows, and the bytes
// of any other metric as hexadecimal text. Escapes characters that could control a terminal.
std::vector<RowCell> recordCells(ShowRecords::Kind kind,
                                 const platform::linux_::StoredRecord& record);
// A JSON object with the time and the columns' names on one line.
std::string recordJson(ShowRecords::Kind kind, const platform::linux_::StoredRecord& record);

// Prints the selected records, as showEvents() does.
ExitStatus showRecords(const ShowRecords& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
