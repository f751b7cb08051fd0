#pragma once

#include <functional>
#include <string>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// What clients may ask of the service's store through the interface com.tarno.halvox.Storage. The
// functions run on the I/O thread and must not block. Those that are missing refuse or answer
// nothing.
struct StorageControl {
  // Begins a vacuum. The options are "before", a time in seconds since 1970, and "to", a number of
  // bytes. Returns why not, or an empty text.
  std::function<std::string(const Dictionary& options)> beginVacuum;
  // Returns how the vacuum is getting on, or how the last one ended.
  std::function<Dictionary()> vacuumState;
  // The same for an erasure. The only option is "app", a name, "session", a number, or "before".
  std::function<std::string(const Dictionary& options)> beginErase;
  std::function<Dictionary()> eraseState;
};

}  // namespace halvox::platform::linux_
