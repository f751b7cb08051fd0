#pragma once

#include <utility>

#include <unistd.h>

namespace halvox::platform::linux_ {

// Owns one handle of a C library and releases it with `kRelease`, whose result is ignored.
// Move-only. An empty one holds `kNone` and releases nothing.
//
//   using Bus = UniqueHandle<sd_bus*, sd_bus_flush_close_unref>;
//   Bus bus;
//   if (const int result = sd_bus_new(bus.out()); result < 0) ...
template <typename Raw, auto kRelease, Raw kNone = Raw{}>
class UniqueHandle {
 public:
  constexpr UniqueHandle() noexcept = default;
  constexpr explicit UniqueHandle(Raw raw) noexcept : raw_(raw) {}
  UniqueHandle(UniqueHandle&& other) noexcept : raw_(other.release()) {}
  UniqueHandle& operator=(UniqueHandle&& other) noexcept {
    reset(other.release());
    return *this;
  }
  ~UniqueHandle() { reset(); }

  [[nodiscard]] Raw get() const noexcept { return raw_; }
  explicit operator bool() const noexcept { return raw_ != kNone; }

  // Gives up the handle without calling `kRelease`.
  [[nodiscard]] Raw release() noexcept { return std::exchange(raw_, kNone); }
  // Releases the old handle and takes `raw` instead.
  void reset(Raw raw = kNone) noexcept {
    const Raw old = std::exchange(raw_, raw);
    if (old != kNone && old != raw) static_cast<void>(kRelease(old));
  }
  // Releases the old handle and returns the address where a C function can store a new one.
  [[nodiscard]] Raw* out() noexcept {
    reset();
    return &raw_;
  }

 private:
  Raw raw_ = kNone;
};

using UniqueFd = UniqueHandle<int, ::close, -1>;

}  // namespace halvox::platform::linux_
