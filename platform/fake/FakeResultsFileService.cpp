#include "platform/fake/FakeResultsFileService.h"

#include <utility>

namespace halvox::platform {
namespace {

class FakeWriter final : public Sswriter {
 public:
  explicit FakeWriter(std::shared_ptr<FakeResultsFileService::File> written)
      : file(std::move(written)) {}
  const std::shared_ptr<FakeResultsFileService::File> file;
};

}  // namespace

void FakeResultsFileService::failToOpen() {
  const std::lock_guard lock(mutex_);
  fails_ = true;
}

void FakeResultsFileService::failToOpen(std::string path) {
  const std::lock_guard lock(mutex_);
  unusable_.insert(std::move(path));
}

std::optional<FakeResultsFileService::File> FakeResultsFileService::finished(
    const std::string& path) const {
  const std::lock_guard lock(mutex_);
  const auto file = finished_.find(path);
  return file == finished_.end() ? std::nullopt : std::optional(*file->second);
}

std::vector<FakeResultsFileService::File> FakeResultsFileService::files() const {
  const std::lock_guard lock(mutex_);
  std::vector<File> result;
  for (const auto& file : files_) result.push_back(*file);
  return result;
}

ResultsFileService::Writer FakeResultsFileService::sswriter_open(std::string_view path,
                                                                 std::string_view productName,
                                                                 std::uint32_t version,
                                                                 std::uint32_t flags) {
  journal_.note("results open");
  const std::lock_guard lock(mutex_);
  if (fails_ || unusable_.contains(path)) return nullptr;
  files_.push_back(
      std::make_shared<File>(File{std::string(path), std::string(productName), version, flags}));
  return std::make_unique<FakeWriter>(files_.back());
}

void FakeResultsFileService::sswriter_new_value(Sswriter& writer, std::string_view name,
                                                ssunit unit, double value) {
  const std::lock_guard lock(mutex_);
  dynamic_cast<FakeWriter&>(writer).file->measurements.push_back({std::string(name), unit, value});
}

void FakeResultsFileService::sswriter_close(Writer writer) {
  if (writer == nullptr) return;
  journal_.note("results close");
  const std::lock_guard lock(mutex_);
  const auto& file = dynamic_cast<FakeWriter&>(*writer).file;
  file->isClosed = true;
  finished_.insert_or_assign(file->path, file);
}

}  // namespace halvox::platform
