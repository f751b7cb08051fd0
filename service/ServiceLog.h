#pragma once

#include <cstddef>
#include <string>

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"
#include "session/HVReportingSession.h"

namespace halvox {

// The log of this folder's sources. All of them log under the name of the delegate's class, which
// tools match.
inline constexpr platform::UnitLog kServiceLog(&HVReportingServiceDelegateCategory,
                                               "HVReportingServiceDelegate");

// The bytes after which a list in a log line ends; the remaining elements are only counted. With
// thousands of sessions, describing all of them would cost more than the rest of a start.
inline constexpr std::size_t kMaxListText = 8192;

// Describes a list for a log line: "(first, second, and 7 more)". Builds the text only if the line
// is written. `Append` appends one element to a text. The list must outlive this.
template <typename List, typename Append>
class ListDescription {
 public:
  ListDescription(const List& list, Append append) : list_(list), append_(append) {}

  // Takes time in proportion to the text, not to the list.
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

// Describes a list of shared pointers to sessions. The list must outlive the result.
template <typename List>
auto sessionsDescription(const List& sessions) {
  return ListDescription(
      sessions, [](std::string& text, const auto& session) { session->appendDescription(text); });
}

}  // namespace halvox
