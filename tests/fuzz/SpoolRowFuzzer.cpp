// Reads arbitrary bytes as a row of the link's spool: packed, and as the content of an unpacked
// row. The first byte is the number of messages. What can be read must come out the same after
// being written again.

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "platform/linux/store/spool/SpoolRow.h"
#include "tests/fuzz/InputFile.h"

namespace {

using namespace halvox::platform::linux_;
using halvox::fuzzing::require;

void writeAgain(const std::vector<SpooledMessage>& messages) {
  SpoolRowWriter writer;
  for (const SpooledMessage& message : messages) writer.add(message);
  const auto row = writer.finish();
  require(row.has_value());
  require(readSpoolRow(*row, messages.size()) == messages);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data + 1), size - 1);
  if (const auto messages = readSpoolTexts(bytes, data[0])) writeAgain(*messages);
  if (const auto messages = readSpoolRow(bytes, data[0])) writeAgain(*messages);
  return 0;
}
