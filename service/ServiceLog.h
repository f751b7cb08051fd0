#pragma once

#include <cstddef>
#include <string>

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"
#include "session/HVReportingSession.h"

namespace halvox {

// What the sources of the service core log with; all under the delegate's name.
inline constexpr platform::UnitLog kServiceLog(&HVReportingServiceDelegateCategory,
                                               "HVReportingServiceDelegate");

// A log line ends about here whatever is in it, so what a list has beyond is only counted: with
// thousands of sessions, describing them would cost more than all else that a start does.
inline constexpr std::size_t kMaxListText = 8192;

// A list as log lines show it: "(first, second)". Put together only when the line is written.
// `Append` adds one element to a text. Refers to the list, which must outlive it.
template <typename List, typename Append>
class ListDescription {
 public:
  ListDescription(const List& list, Append append) : list_(list), append_(append) {}

  [[nodiscard]] std::string description() const {
    std::string text = "(";
    std::size_t left = list_.size();
    for (const auto& element : list_) {
      if (text.size() > kMaxListText) {
        text += ", and " + std::to_string(left) + " more";
        break;
      }
      if (text.size() > 1) text += ", ";
      append_(text, element);
      --left;
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
