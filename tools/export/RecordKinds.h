#pragma once

#include <cstdint>
#include <string_view>

#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::tools {

// The kinds of records, in the order of the words below.
enum class ExportKind : std::uint8_t { kEvents, kMetrics, kPower, kLink, kSnapshots, kLosses };

// The kinds that an export has.
struct ExportKinds {
  bool events = true;
  bool metrics = true;
  bool power = true;
  bool link = true;
  bool snapshots = true;
  bool losses = true;

  [[nodiscard]] bool has(ExportKind kind) const;
};

[[nodiscard]] ExportKind kindOf(const platform::linux_::StoredItem& item);
// The word for a kind in options and in exported records: that of the command which shows it.
[[nodiscard]] std::string_view wordOf(ExportKind kind);
// The kinds that the store must read.
[[nodiscard]] platform::linux_::StoredKinds storedKinds(const ExportKinds& kinds);

}  // namespace halvox::tools
