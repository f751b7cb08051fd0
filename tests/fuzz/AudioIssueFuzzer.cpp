// Hostile bytes as an issue metric. Whatever is read can be shown, and written and read again with
// the same result; reading stays within the bytes and ends.

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

// What was read up to an error is a message like any other.
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
  // On a boundary of their own, so that sanitizers see their exact end.
  const std::vector<std::uint8_t> bytes(data, data + size);
  halvox::zubmetrics::read(std::as_bytes(std::span(bytes)));
  return 0;
}
