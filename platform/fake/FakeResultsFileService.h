#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/results_file.h"

namespace halvox::platform {

// Keeps the results files that were written. A file appears under its name, and replaces an older
// one, when it is closed. Opening and closing are in the journal. Any thread may call. FakePlatform
// owns it.
class FakeResultsFileService final : public ResultsFileService {
 public:
  struct Measurement {
    std::string name;
    ssunit unit;
    double value;
    friend bool operator==(const Measurement&, const Measurement&) = default;
  };
  struct File {
    std::string path;
    std::string productName;
    std::uint32_t version = 0;
    std::uint32_t flags = 0;
    std::vector<Measurement> measurements{};
    bool isClosed = false;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeResultsFileService(Journal& journal) : journal_(journal) {}

  // Makes the opening of every file fail.
  void failToOpen();
  // Makes the opening of that file fail.
  void failToOpen(std::string path);
  // All files that were begun, in order.
  [[nodiscard]] std::vector<File> files() const;
  // The file with that path; none if none was finished there.
  [[nodiscard]] std::optional<File> finished(const std::string& path) const;

  Writer sswriter_open(std::string_view path, std::string_view productName, std::uint32_t version,
                       std::uint32_t flags) override;
  void sswriter_new_value(Sswriter& writer, std::string_view name, ssunit unit,
                          double value) override;
  void sswriter_close(Writer writer) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  bool fails_ = false;
  std::set<std::string, std::less<>> unusable_;
  std::map<std::string, std::shared_ptr<File>> finished_;
  std::vector<std::shared_ptr<File>> files_;
};

}  // namespace halvox::platform
