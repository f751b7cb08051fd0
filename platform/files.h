#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/value.h"

namespace halvox::platform {

// One file of indented JSON text that comes into being piece by piece and appears under its name
// complete or not at all. Belongs to one thread. Letting go of it before commit() leaves nothing.
class JsonArrayFile {
 public:
  virtual ~JsonArrayFile() = default;

  // Adds one object to the array that the file holds: `{key: value}`. After an error the rest is
  // ignored; commit() tells the error.
  virtual void appendObject(std::string_view key, const Dictionary& value) = 0;
  // Ends the array and gives the file its name; the path of the file, as it is in the file system.
  [[nodiscard]] virtual std::optional<Error> commit(std::string& path) = 0;
};

// Directories and files that the system leaves for people and other programs. Paths are the fixed
// absolute ones of the system; the platform puts its storage root before them. Any thread may call;
// everything here waits for the disk.
class FileService {
 public:
  virtual ~FileService() = default;

  // Makes a directory with all its parents, with these permissions; one that exists is fine.
  [[nodiscard]] virtual std::optional<Error> createDirectory(std::string_view path,
                                                             std::uint32_t permissions) = 0;
  // Begins a file in the directory. Never null: what is wrong shows at commit().
  [[nodiscard]] virtual std::unique_ptr<JsonArrayFile> createJsonArrayFile(
      std::string_view directory, std::string_view name) = 0;
};

}  // namespace halvox::platform
