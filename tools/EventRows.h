#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::tools {

// Shows a message once. The service stores each message under two names: first
// "com.tarno.halvox.<category>.<type>", then the same with the name of a service instead of
// "halvox". The second name says more and is the one that is shown; an event whose partner is
// missing is shown as it is. Two consecutive events are one message if category, type and payload
// are equal. Belongs to one thread.
//
// In the order of storing, an event with the first name is held back until the next event shows
// whether the two belong together. flush() shows it at the latest.
class EventRows {
 public:
  using Show = std::function<void(const platform::linux_::StoredEvent&)>;

  EventRows(platform::linux_::RecordOrder order, Show show)
      : order_(order), show_(std::move(show)) {}

  // Treats the event with this number as shown already. It must be the first event that is added,
  // or not be added at all.
  void treatAsShown(platform::linux_::StoredRecordID id) { shownBefore_ = id; }
  // Takes the next event. Calls show() for it, for the event before it, for both or for none.
  void add(const platform::linux_::StoredEvent& event);
  // Shows the event that is held back. If its partner is added later, the partner is not shown.
  void flush();

 private:
  // An event with texts of its own.
  struct Copy {
    platform::linux_::StoredRecordID id;
    double time;
    std::string name;
    std::string payload;
    std::string application;
    bool isShown;
  };
  void remember(const platform::linux_::StoredEvent& event, bool isShown);
  [[nodiscard]] bool isPartner(const platform::linux_::StoredEvent& event) const;

  platform::linux_::RecordOrder order_;
  Show show_;
  std::optional<platform::linux_::StoredRecordID> shownBefore_;
  // The event before, if the next one may be its partner.
  std::optional<Copy> last_;
};

}  // namespace halvox::tools
