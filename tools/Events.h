#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

// Formats one event on one line, without a line end: the local time, the name and the payload's
// fields, or a JSON object with "time", "name" and "payload". Escapes characters of the payload
// that could control a terminal.
std::string formatEvent(const platform::linux_::StoredEvent& event, OutputForm form);

// A request for stored events. An empty list stands for all.
struct ShowEvents {
  RecordSelection selection{};
  std::vector<std::string> applications{};  // glob patterns
  std::vector<std::uint32_t> categories{};  // one without a domain stands for all domains
  std::vector<std::uint16_t> types{};
};

// Prints the selected events, newest last. With --follow, continues with new events until the
// output is closed or the directory of the store is deleted. `outputDescriptor` is the descriptor
// of `out`.
ExitStatus showEvents(const ShowEvents& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
