// Reads arbitrary bytes as a block of messages of the store: the first byte is the number of
// records. A block that can be read must come out the same after being written again.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/store/blocks/MessageBlockReader.h"
#include "platform/linux/store/blocks/MessageBlockWriter.h"

namespace {

using namespace halvox::platform::linux_;

// A plain copy of a record, in the order of the block.
struct Copy {
  BlockRecordKind kind;
  double time;
  std::string texts;
};

bool read(std::string_view block, std::int64_t records, std::vector<Copy>& copies,
          MessageBlockWriter* writer) {
  MessageBlockReader reader;
  reader.open(block, records);
  while (reader.next()) {
    const BlockRecord& record = reader.record();
    std::string texts = std::to_string(record.sessionID) + ' ' + std::to_string(record.category) +
                        ' ' + std::to_string(record.type) + ' ';
    texts.append(record.name).append(1, '\n').append(record.application).append(1, '\n');
    texts.append(record.clientName).append(1, '\n');
    texts.append(record.serviceName).append(1, '\n').append(record.payload);
    copies.push_back({record.kind, record.time, std::move(texts)});
    if (writer == nullptr) continue;
    const LinkParty party{record.sessionID, std::string(record.clientName),
                          std::string(record.serviceName)};
    switch (record.kind) {
      case BlockRecordKind::kGap:
        writer->addGap();
        break;
      case BlockRecordKind::kEvent:
        writer->addEvent(record.time, {record.name, record.application}, record.payload);
        break;
      case BlockRecordKind::kLink:
        writer->addLink(record.time,
                        {party, static_cast<std::uint16_t>(record.category),
                         static_cast<std::uint16_t>(record.type)},
                        record.payload);
        break;
    }
  }
  return !reader.isDamaged();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  MessageBlockWriter writer;
  std::vector<Copy> first;
  if (!read(bytes.substr(1), data[0], first, &writer)) return 0;
  for (const BlockPacking packing : {BlockPacking::kPlain, BlockPacking::kZstd}) {
    std::vector<Copy> second;
    if (!read(writer.finish(packing), data[0], second, nullptr)) std::abort();
    if (second.size() != first.size()) std::abort();
    for (std::size_t index = 0; index < first.size(); ++index) {
      // A NaN is not equal to itself. Two NaN count as the same time.
      const bool isSameTime =
          first[index].time == second[index].time ||
          (first[index].time != first[index].time && second[index].time != second[index].time);
      if (first[index].kind != second[index].kind || !isSameTime ||
          first[index].texts != second[index].texts) {
        std::abort();
      }
    }
  }
  return 0;
}
