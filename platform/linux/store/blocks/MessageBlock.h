#pragma once

#include <cstddef>
#include <cstdint>

namespace halvox::platform::linux_ {

// How a block of messages is stored in one row. The first byte says how the rest is packed. The
// rest is the records, either as they are or as one zstd frame with a checksum.
//
//   record   number: its kind (BlockRecordKind, two bits) and above it the number of its head
//            a gap ends here
//            head 0: a new head follows, which gets the next number, from 1
//              of an event           name, application (may be empty)
//              of a link message     session (signed), client name, service name, category, type
//            signed number: the bits of its time, minus those of the record before
//            number: how many bytes of the payload before also begin this one
//            text: the rest of the payload
//   text     number of bytes, bytes
//   number   in base 128, the lowest seven bits first; signed ones zigzag: 0, -1, 1, -2, ...
//
// Payloads are the JSON texts that readers get. Fields in binary form were tried. After compression
// they were as long as JSON. Packing took 1.0 us instead of 1.3 us for a repetitive message, but
// 3.1 us for one of varied texts, and every reader would have to make the JSON itself.
enum class BlockPacking : std::uint8_t { kPlain = 1, kZstd = 2 };

enum class BlockRecordKind : std::uint8_t {
  kGap = 0,  // a deleted record, which keeps the numbers of the records after it
  kEvent = 1,
  kLink = 2,
};
constexpr std::uint64_t kBlockKindBits = 2;

// An unpacked block that is longer counts as damaged. No block that the service writes is as long,
// because StoreSizes limits a payload to 256 MiB and MessageBlocks seals a block soon after 256
// KiB.
constexpr std::uint64_t kLongestBlock = std::uint64_t{2} << 30U;

}  // namespace halvox::platform::linux_
