#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "tools/ExplainText.h"
#include "tools/Explanation.h"
#include "tools/MessageFates.h"

// What each consumer of messages took. Pure functions.
namespace halvox::tools {

// What became of several messages.
struct MessageTally {
  struct Count {
    std::uint64_t messages = 0;
    std::int64_t newest = 0;  // the record of the last one
    void add(std::int64_t record) {
      ++messages;
      newest = record;
    }
  };
  static constexpr std::size_t kLinkFates = 8;

  std::uint64_t messages = 0;
  Count common;     // recorded as the event of all services
  Count ofService;  // recorded as the event of the service type
  std::array<Count, kLinkFates> links{};
  std::uint64_t exempt = 0;
  std::map<std::string, std::uint64_t, std::less<>> services{};
  std::optional<double> first{};  // seconds since 1970
  std::optional<double> last{};

  void add(const MessageFate& fate);
  [[nodiscard]] const Count& link(LinkFate fate) const {
    return links[static_cast<std::size_t>(fate)];
  }
};

// Records that the pass over the store found for a single message.
struct RelatedRecords {
  std::optional<std::int64_t> powerEvent{};  // IDs
  std::optional<std::int64_t> metric{};
  std::optional<std::int64_t> summary{};  // that of its session, if it has the time stamp
};

// Where the messages of an event or of a session went.
[[nodiscard]] std::vector<Explanation::Sink> sinksOf(const MessageTally& tally,
                                                     const MessageName& name,
                                                     const ExplainSettings& settings);
// Where one message went.
[[nodiscard]] std::vector<Explanation::Sink> sinksOf(const MessageFate& fate,
                                                     const RelatedRecords& related,
                                                     const ExplainSettings& settings);
}  // namespace halvox::tools
