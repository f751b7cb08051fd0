#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

// Stored records of the kinds other than events.
struct ShowRecords {
  enum class Kind : std::uint8_t { kMetrics, kPower, kLink, kSnapshots };
  Kind kind = Kind::kLink;
  RecordSelection selection{};  // its names are those of power events or of the link's services
  // Numbers that the records have; none: all.
  std::vector<std::int64_t> ids{};  // of metrics, or of the link's sessions
  // Of power events, or of the link's messages with their domains; one without a domain stands for
  // all domains.
  std::vector<std::int64_t> categories{};
  std::vector<std::int64_t> types{};
};

// One record on one line, without its end: the local time and what stands in its columns, or a JSON
// object under the columns' names. Of a metric that is known the fields are shown, of any other the
// bytes as hexadecimal text. What a client sent cannot drive a terminal.
std::string formatRecord(ShowRecords::Kind kind, const platform::linux_::StoredRecord& record,
                         OutputForm form);

// Prints the stored records that were asked for, as showEvents() does.
ExitStatus showRecords(const ShowRecords& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
