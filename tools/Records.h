#pragma once

#include <ostream>
#include <string>

#include "platform/linux/store/StoreReader.h"
#include "tools/Command.h"
#include "tools/Events.h"

namespace halvox::tools {

// One record on one line, without its end: the local time and what stands in its columns, or a JSON
// object under the columns' names. Of a metric that is known the fields are shown, of any other the
// bytes as hexadecimal text. What a client sent cannot drive a terminal.
std::string formatRecord(ShowRecords::Kind kind, const platform::linux_::StoredRecord& record,
                         EventForm form);

// Prints the stored records that were asked for, as showEvents() does.
ExitStatus showRecords(const ShowRecords& request, EventForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
