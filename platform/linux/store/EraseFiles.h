#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/store/EraseSelection.h"

namespace halvox::platform::linux_ {

// Where the service keeps files besides its database.
struct ErasePlaces {
  std::filesystem::path directory;  // of the database
  std::filesystem::path root;       // the storage root, below which summary files are
};

// Deletes the files that hold something of a selection:
//
//   summaries of sessions    with the application's name in their names, with its name as a text,
//   or
//                            with a stamp of a message of the selection; by their age, if a time is
//                            to be erased
//   captures of diagnostics  all, because they hold log lines of every client; by their age, if a
//                            time is to be erased
//   damaged databases        all, because nothing can be selected in them
//
// Does not follow symbolic links. Belongs to the writer's thread. Blocks on the disk.
class EraseFiles {
 public:
  explicit EraseFiles(ErasePlaces places) : places_(std::move(places)) {}

  // Looks for the files that exist now.
  void begin();
  // Looks at the next file, and deletes it if it is selected. Returns false if there is none.
  bool eraseNext(const EraseSelection& selection);
  [[nodiscard]] std::uint64_t erased() const { return erased_; }
  // Why a file could not be read or deleted; empty if all could.
  [[nodiscard]] const std::string& problem() const { return problem_; }

 private:
  enum class Kind : std::uint8_t { kSummary, kCapture, kDamaged };
  struct File {
    std::filesystem::path path;
    Kind kind;
  };

  void addSummaries();
  [[nodiscard]] bool selects(const EraseSelection& selection, const File& file);
  [[nodiscard]] bool selectsText(const EraseSelection& selection,
                                 const std::filesystem::path& path);

  const ErasePlaces places_;
  std::vector<File> files_;
  std::uint64_t erased_ = 0;
  std::string problem_;
};

// Returns true if this is the name of a summary file of that application.
[[nodiscard]] bool isSummaryOf(std::string_view fileName, std::string_view application);

}  // namespace halvox::platform::linux_
