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

// The columns of an event after its time: the name and the payload's fields. Escapes characters
// that could control a terminal.
std::vector<RowCell> eventCells(const platform::linux_::StoredEvent& event);
// A JSON object with "time", "name" and "payload" on one line.
std::string eventJson(const platform::linux_::StoredEvent& event);

// A request for stored events. An empty list stands for all.
struct ShowEvents {
  RecordSelection selection{};
  std::vector<std::string> applications{};  // glob patterns
  std::vector<std::uint32_t> categories{};  // one without a domain stands for all domains
  std::vector<std::uint16_t> types{};
  // Events of messages that the link recorded for one of these sessions. Not together with
  // following: the link records a message later than the events do.
  std::vector<std::int64_t> sessions{};
  // JSON has everything. Text has by default only one of the two events of a message (EventRows),
  // and no events about connections of halvoxctl itself, each of whose commands would add one.
  bool hasAllNames = false;
  bool hasOwnEvents = false;
};

// Prints the selected events. With --follow, continues with new events until the
// output is closed or the directory of the store is deleted. `outputDescriptor` is the descriptor
// of `out`.
ExitStatus showEvents(const ShowEvents& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
