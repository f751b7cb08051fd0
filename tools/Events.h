#pragma once

#include <ostream>
#include <string>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

// One event on one line, without its end: the local time, the name and the payload's fields, or a
// JSON object with "time", "name" and "payload". What a client sent cannot drive a terminal.
std::string formatEvent(const platform::linux_::StoredEvent& event, OutputForm form);

// Prints the stored events that were asked for, newest last; with --follow until the output is
// closed or the store's directory is gone. `outputDescriptor` is what `out` writes to.
ExitStatus showEvents(const RecordSelection& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
