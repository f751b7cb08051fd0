#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/value.h"

namespace halvox::platform {

// One file of indented JSON text that is written piece by piece. It appears under its name when it
// is complete, or not at all. A reader therefore never sees an incomplete summary.
//
// The caller owns it and uses it on one thread. Destroying it before commit() removes what was
// written. Writing in pieces avoids a second copy of a large history in memory.
class JsonArrayFile {
 public:
  virtual ~JsonArrayFile() = default;

  // Adds the object `{key: value}` to the array that the file holds. After the first failure
  // further objects are ignored; commit() returns that failure.
  virtual void appendObject(std::string_view key, const Dictionary& value) = 0;
  // Ends the array and gives the file its name. Sets `path` to the file's path in the file system,
  // or returns the first error and leaves no file.
  [[nodiscard]] virtual std::optional<Error> commit(std::string& path) = 0;
};

// Directories and files that the service leaves for people and other programs. Paths are the fixed
// absolute ones of the system; the platform puts its storage root in front of them.
//
// Any thread may call. Every call waits for the disk. The composition root owns the service.
class FileService {
 public:
  virtual ~FileService() = default;

  // Makes a directory and its missing parents with these permission bits. A directory that exists
  // is not an error.
  [[nodiscard]] virtual std::optional<Error> createDirectory(std::string_view path,
                                                             std::uint32_t permissions) = 0;
  // Begins a file in the directory. Never returns null. If the file cannot be created, commit()
  // returns the error, because the caller must handle errors of commit() anyway.
  [[nodiscard]] virtual std::unique_ptr<JsonArrayFile> createJsonArrayFile(
      std::string_view directory, std::string_view name) = 0;
};

}  // namespace halvox::platform
