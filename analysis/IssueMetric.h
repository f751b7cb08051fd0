#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::analysis {

// The metric of an issue that a client detected.
inline constexpr std::int64_t kAudioIssueDetected = 0x5B0003;

struct AudioIssue {
  std::string type;
  std::string node;
  std::string client;
};

// Decodes the message of such a metric. Returns nothing if the bytes are not one. In texts, bytes
// that are not UTF-8 are replaced.
[[nodiscard]] std::optional<AudioIssue> parseAudioIssue(std::string_view bytes);

}  // namespace halvox::analysis
