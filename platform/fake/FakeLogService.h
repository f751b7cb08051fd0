#pragma once

#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/log.h"

namespace halvox::platform {

// Keeps every log line. Categories live as long as the process and write to the newest fake log
// service, because code under test keeps them in static variables. At first every level is wanted.
// Any thread may log. FakePlatform owns it.
class FakeLogService final : public LogService {
 public:
  struct Line {
    LogLevel level;
    std::string subsystem;
    std::string category;
    std::string line;  // as it was written
    std::string text;  // without the prefix of unit and source line
  };

  // Does not own the journal, which must outlive it.
  explicit FakeLogService(Journal& journal);
  FakeLogService(const FakeLogService&) = delete;
  FakeLogService& operator=(const FakeLogService&) = delete;
  ~FakeLogService() override;

  // Sets the lowest level that is wanted, for every category.
  void setLevel(LogLevel level);
  void clear();

  [[nodiscard]] std::vector<Line> lines() const;
  [[nodiscard]] std::vector<Line> lines(LogLevel level) const;
  [[nodiscard]] std::vector<std::string> texts() const;
  [[nodiscard]] std::vector<std::string> texts(LogLevel level) const;
  [[nodiscard]] bool containsText(std::string_view text) const;

  LogCategory& createCategory(std::string_view subsystem, std::string_view category) override;

 private:
  friend class FakeLogCategory;
  void record(Line line);

  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
};

}  // namespace halvox::platform
