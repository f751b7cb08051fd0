#include "tools/SnapshotFiles.h"

#include <algorithm>
#include <filesystem>
#include <iomanip>
#include <map>
#include <sstream>
#include <string>
#include <system_error>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/diagnostics/SnapshotDirectory.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"
#include "tools/SnapshotReader.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;

using platform::Dictionary;
using platform::Value;
using platform::linux_::Failure;
using platform::linux_::Result;

constexpr const char* kSignatureName = "signature.json";
constexpr const char* kManifestName = "manifest.json";
// Limits the width, so that one long name does not fill all lines with blanks. An archive of 200 KB
// with one such name printed 400 MB of blanks.
constexpr std::size_t kWidestColumn = 40;

// Returns the archive that an argument means, or the exit status if there is none.
std::variant<fs::path, ExitStatus> findSnapshot(const std::string& file,
                                                const Complaint& complain) {
  if (file.empty()) {
    return complain(ExitStatus::kBadArguments,
                    R"(FILE: "" is not a file; expected an archive, or "newest")");
  }
  if (file != "newest") return fs::path(file);
  const auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  const platform::linux_::SnapshotDirectory directory(
      std::get<platform::linux_::Configuration>(configuration).storage.directory);
  const auto all = directory.newestFirst();
  if (all.empty()) {
    std::error_code error;
    // An empty list has two causes: there is no snapshot, or this user may not read the directory.
    // Opening the directory again tells the causes apart.
    const fs::directory_iterator opened(directory.path(), error);
    if (error && error != std::errc::no_such_file_or_directory) {
      return complain(ExitStatus::kNoService, directory.path().native() + ": " + error.message(),
                      "no-store");
    }
    return complain(ExitStatus::kNoService, "there is no snapshot in " + directory.path().native(),
                    "no-store");
  }
  return all.front();
}

struct Contents {
  Dictionary signature;
  Dictionary manifest;
};

// Returns the signature and manifest of a snapshot, or an error.
Result<Contents> readContents(const fs::path& file) {
  auto read = readSnapshotFiles(file, {kSignatureName, kManifestName});
  if (!read) return std::move(read).error();
  const std::map<std::string, std::string>& texts = *read;
  Contents contents;
  for (const auto& [name, target] : {std::pair(kSignatureName, &contents.signature),
                                     std::pair(kManifestName, &contents.manifest)}) {
    const auto text = texts.find(name);
    if (text == texts.end()) {
      return Failure<>{file.native() + ": not a snapshot: it has no " + name};
    }
    auto parsed = parseDictionary(text->second);
    if (!parsed) {
      return Failure<>{file.native() + ": " + name + " in it: " + parsed.error().message};
    }
    *target = *std::move(parsed);
  }
  return contents;
}

std::string textOf(const Dictionary& dictionary, const char* key) {
  const Value* value = dictionary.find(key);
  if (value == nullptr) return "unknown";
  return harmlessText(value->isString() ? std::string(value->string()) : toJson(*value));
}

std::string secondsOf(const Dictionary& dictionary) {
  const Value* value = dictionary.find("seconds");
  std::ostringstream text;
  text << std::fixed << std::setprecision(3) << (value == nullptr ? 0.0 : value->toDouble())
       << " s";
  return text.str();
}

// "signature.json    180 bytes  0.000 s" or "pw-dump.json  missing: …".
void printItem(const Dictionary& item, std::size_t width, std::ostream& out) {
  out << "  " << std::left << std::setw(static_cast<int>(width)) << textOf(item, "name") << "  ";
  const Value* isCollected = item.find("collected");
  if (isCollected != nullptr && isCollected->toBool()) {
    out << std::right << std::setw(10) << textOf(item, "bytes") << " bytes  " << secondsOf(item);
    if (item.contains("cut")) out << "  (cut)";
  } else {
    out << "missing: " << textOf(item, "reason");
  }
  out << '\n';
}

void printText(const fs::path& file, const Contents& contents, std::ostream& out) {
  out << harmlessText(file.native()) << "\n  taken " << textOf(contents.manifest, "time") << " in "
      << secondsOf(contents.manifest) << "\n\nSignature\n";
  std::size_t width = 0;
  for (const auto& [key, value] : contents.signature) width = std::max(width, key.text().size());
  width = std::min(width, kWidestColumn);
  for (const auto& [key, value] : contents.signature) {
    const std::string name(key.text());
    out << "  " << std::left << std::setw(static_cast<int>(width)) << harmlessText(name) << "  "
        << textOf(contents.signature, name.c_str()) << '\n';
  }
  out << "\nContents\n";
  const Value* items = contents.manifest.find("items");
  if (items == nullptr) return;
  const platform::Array list = items->array();
  width = 0;
  for (const Value& item : list) {
    width = std::max(width, textOf(item.dictionary(), "name").size());
  }
  width = std::min(width, kWidestColumn);
  for (const Value& item : list) printItem(item.dictionary(), width, out);
}

// Returns the archive's name without its extension: "20260301T120000Z-haptics-Generic".
std::string stemOf(const fs::path& file) {
  std::string name = file.filename().native();
  constexpr std::string_view kSuffix = ".tar.zst";
  if (name.size() > kSuffix.size() && name.ends_with(kSuffix)) {
    name.resize(name.size() - kSuffix.size());
  } else {
    name += ".files";
  }
  return name;
}

}  // namespace

ExitStatus showSnapshot(const ShowSnapshot& request, OutputForm form, std::ostream& out,
                        std::ostream& errors) {
  const Complaint complain("snapshots show", form, out, errors);
  const auto found = findSnapshot(request.file, complain);
  if (const auto* status = std::get_if<ExitStatus>(&found)) return *status;
  const auto& file = std::get<fs::path>(found);
  const auto contents = readContents(file);
  if (!contents) return complain(ExitStatus::kBadArguments, contents.error().message);
  if (form == OutputForm::kJson) {
    out << harmlessJson(toJson(Dictionary{{"file", file.native()},
                                          {"signature", contents->signature},
                                          {"manifest", contents->manifest}}))
        << '\n';
  } else {
    printText(file, *contents, out);
  }
  return ExitStatus::kDone;
}

ExitStatus extractSnapshot(const ExtractSnapshot& request, OutputForm form, std::ostream& out,
                           std::ostream& errors) {
  const Complaint complain("snapshots extract", form, out, errors);
  const auto found = findSnapshot(request.file, complain);
  if (const auto* status = std::get_if<ExitStatus>(&found)) return *status;
  const auto& file = std::get<fs::path>(found);
  const fs::path directory = request.directory.empty() ? stemOf(file) : request.directory;
  const auto extracted = unpackSnapshot(
      file, directory, request.force ? ExistingFiles::kReplace : ExistingFiles::kRefuse);
  if (!extracted) return complain(ExitStatus::kRefused, extracted.error().message);
  for (const std::string& name : *extracted) {
    const std::string path = (directory / name).native();
    if (form == OutputForm::kJson) {
      out << harmlessJson(toJson(Dictionary{{"file", path}})) << '\n';
    } else {
      out << harmlessText(path) << '\n';
    }
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
