#include "analysis/IssueMetric.h"

#include <cstddef>
#include <span>

#include "platform/protobuf.h"

namespace halvox::analysis {
namespace {

enum Field : std::uint8_t { kIssueType = 3, kNode, kClient };

}  // namespace

std::optional<AudioIssue> parseAudioIssue(std::string_view bytes) {
  platform::ProtoReader reader(std::as_bytes(std::span(bytes)));
  AudioIssue issue;
  while (reader.hasMore()) {
    const auto tag = reader.readTag();
    if (reader.hasError()) break;
    if (tag.number == kIssueType) {
      reader.readString(issue.type);
    } else if (tag.number == kNode) {
      reader.readString(issue.node);
    } else if (tag.number == kClient) {
      reader.readString(issue.client);
    } else if (!reader.skipField(tag.number, tag.wireType)) {
      break;
    }
  }
  if (reader.hasError()) return std::nullopt;
  return issue;
}

}  // namespace halvox::analysis
