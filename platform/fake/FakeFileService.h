#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/files.h"

namespace halvox::platform {

// Keeps directories and files in memory. A committed file has the path "/root<directory>/<name>".
// Any thread may call the service; only the test's thread reads the results. FakePlatform owns it.
class FakeFileService final : public FileService {
 public:
  struct File {
    std::string directory;
    std::string name;
    std::vector<std::pair<std::string, Dictionary>> objects{};
    friend bool operator==(const File&, const File&) = default;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeFileService(Journal& journal) : journal_(journal) {}

  // Makes the creation of directories, or the commit of files, fail with that error; none ends the
  // failures. Files can be committed in a directory whose creation failed, so that a test can cause
  // each failure alone.
  void setDirectoryError(std::optional<Error> error);
  void setFileError(std::optional<Error> error);

  // All calls in order, whether they succeeded or not: "directory /a 511", "file /a/b.json",
  // "object key = {foo = 1}", "commit".
  [[nodiscard]] std::vector<std::string> steps() const;
  // The permissions of each directory, by its path.
  [[nodiscard]] std::map<std::string, std::uint32_t> directories() const;
  // The committed files in order; if several have one name, the last.
  [[nodiscard]] std::vector<File> files() const;
  std::optional<Error> createDirectory(std::string_view path, std::uint32_t permissions) override;
  std::unique_ptr<JsonArrayFile> createJsonArrayFile(std::string_view directory,
                                                     std::string_view name) override;

 private:
  friend class FakeJsonArrayFile;
  void step(std::string text);
  std::optional<Error> add(File file);

  Journal& journal_;
  mutable std::mutex mutex_;
  std::optional<Error> directoryError_;
  std::optional<Error> fileError_;
  std::set<std::string> known_;  // all directories that were requested
  std::map<std::string, std::uint32_t> directories_;
  std::vector<File> files_;
  std::vector<std::string> steps_;
};

}  // namespace halvox::platform
