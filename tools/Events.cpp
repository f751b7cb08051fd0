#include "tools/Events.h"

#include "tools/JsonText.h"
#include "tools/StoreRun.h"
#include "tools/TimeText.h"

namespace halvox::tools {

using platform::linux_::EventFollower;
using platform::linux_::RecordFilter;
using platform::linux_::StoredEvent;
using platform::linux_::StoreReader;

std::string formatEvent(const StoredEvent& event, OutputForm form) {
  if (form == OutputForm::kText) {
    // Names and payloads come from clients, which could otherwise control the terminal.
    return localTime(event.time) + "  " + harmlessText(event.name) + "  " +
           fieldsOfJson(event.payload);
  }
  // The store guarantees that the payload is complete JSON on one line.
  return "{\"time\":" + toJson(event.time) + ",\"name\":" + harmlessJson(quoted(event.name)) +
         ",\"payload\":" + harmlessJson(event.payload) + "}";
}

ExitStatus showEvents(const RecordSelection& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors) {
  const auto print = [&](const StoredEvent& event) { out << formatEvent(event, form) << '\n'; };
  return runOverStore({"events", form, request, out, outputDescriptor, errors}, filterOf(request),
                      {[&](StoreReader& reader, const RecordFilter& filter) {
                         return reader.forEachEvent(filter, print);
                       },
                       [&](EventFollower& follower) { return follower.deliver(print); }});
}

}  // namespace halvox::tools
