#pragma once

#include <array>
#include <mutex>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/kdebug.h"

namespace halvox::platform {

// Keeps the trace points in order. Any thread may call. FakePlatform owns it.
class FakeKdebugService final : public KdebugService {
 public:
  struct Point {
    std::uint32_t code;
    std::array<std::uint64_t, 4> arguments;
    friend bool operator==(const Point&, const Point&) = default;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeKdebugService(Journal& journal) : journal_(journal) {}

  [[nodiscard]] std::vector<Point> points() const;
  [[nodiscard]] std::vector<std::uint32_t> codes() const;
  void clear();

  void kdebug_trace(std::uint32_t code, std::uint64_t argument1, std::uint64_t argument2,
                    std::uint64_t argument3, std::uint64_t argument4) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<Point> points_;
};

}  // namespace halvox::platform
