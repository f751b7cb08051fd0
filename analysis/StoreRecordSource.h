#pragma once

#include "analysis/RecordSource.h"

#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::analysis {

// The records of a service's database, whether or not a service writes to it meanwhile. Does not
// own the reader, which must be open and outlive this object.
class StoreRecordSource final : public RecordSource {
 public:
  explicit StoreRecordSource(platform::linux_::StoreReader& reader) : reader_(reader) {}

  [[nodiscard]] platform::linux_::Result<void> forEach(const RecordRange& range,
                                                       const Callback& callback) override;

 private:
  platform::linux_::StoreReader& reader_;
};

}  // namespace halvox::analysis
