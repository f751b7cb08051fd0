#pragma once

#include <string>

#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::tools {

// Makes the text of an export from records, one after the other. Holds no more than a bounded
// number of records. Belongs to one thread.
//
//   begin(); add() each record; finish(). Each appends to the text, which its owner may empty
//   between two calls.
class RecordWriter {
 public:
  RecordWriter() = default;
  RecordWriter(const RecordWriter&) = delete;
  RecordWriter& operator=(const RecordWriter&) = delete;
  virtual ~RecordWriter() = default;

  virtual void begin(std::string& text) = 0;
  virtual void add(const platform::linux_::StoredItem& item, std::string& text) = 0;
  virtual void finish(std::string& text) = 0;
};

}  // namespace halvox::tools
