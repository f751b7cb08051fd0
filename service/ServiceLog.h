#pragma once

#include <string>

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"
#include "session/HVReportingSession.h"

namespace halvox {

// What the sources of the service core log with; all under the delegate's name.
inline constexpr platform::UnitLog kServiceLog(&HVReportingServiceDelegateCategory,
                                               "HVReportingServiceDelegate");

// A list as log lines show it: "(first, second)". Put together only when the line is written.
// `Append` adds one element to a text. Refers to the list, which must outlive it.
template <typename List, typename Append>
class ListDescription {
 public:
  ListDescription(const List& list, Append append) : list_(list), append_(append) {}

  [[nodiscard]] std::string description() const {
    std::string text = "(";
    for (const auto& element : list_) {
      if (text.size() > 1) text += ", ";
      append_(text, element);
    }
    text += ')';
    return text;
  }

 private:
  const List& list_;
  Append append_;
};

// The sessions of a list of shared pointers.
template <typename List>
auto sessionsDescription(const List& sessions) {
  return ListDescription(
      sessions, [](std::string& text, const auto& session) { session->appendDescription(text); });
}

}  // namespace halvox
