// Feeds hostile bytes to the issue metric. Reading must end and must stay within the bytes.
// Whatever was read can be printed, and written and read again with the same result.

#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>
#include <vector>

#include "backends/AudioIssueDetected.h"

namespace halvox::zubmetrics {
namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

void checkRoundTrip(const AudioIssueDetected& issue) {
  platform::ProtoWriter writer;
  issue.writeTo(writer);
  platform::ProtoReader reader(writer.bytes());
  AudioIssueDetected again;
  require(again.readFrom(reader));
  require(reader.position() == reader.end());
  require(again == issue);
  require(again.hash_value() == issue.hash_value());

  platform::ProtoTextFormatter formatter;
  issue.formatText(formatter, "issue");
  require(!formatter.text().empty() && formatter.text().ends_with("}\n"));
}

// The fields that were read before an error are a valid message.
void read(std::span<const std::byte> bytes) {
  platform::ProtoReader reader(bytes);
  AudioIssueDetected issue;
  const bool wasRead = issue.readFrom(reader);
  require(wasRead != reader.hasError());
  require(reader.position() <= reader.end());
  require(issue.issueType().size() + issue.node().size() + issue.rtaidClient().size() <=
          bytes.size());
  checkRoundTrip(issue);
}

}  // namespace
}  // namespace halvox::zubmetrics

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  // The bytes are copied into a block of their own, so that sanitizers see their exact end.
  const std::vector<std::uint8_t> bytes(data, data + size);
  halvox::zubmetrics::read(std::as_bytes(std::span(bytes)));
  return 0;
}
