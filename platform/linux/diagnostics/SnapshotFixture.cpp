#include "platform/linux/diagnostics/SnapshotFixture.h"

#include <algorithm>
#include <array>
#include <fstream>
#include <iterator>
#include <system_error>

#include <archive.h>
#include <archive_entry.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::chrono::seconds kPatience{30};

}  // namespace

void writeText(const fs::path& file, std::string_view text) {
  fs::create_directories(file.parent_path());
  std::ofstream(file, std::ios::binary) << text;
}

std::string readText(const fs::path& file) {
  std::ifstream stream(file, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), {}};
}

std::map<std::string, std::string> archiveFiles(const fs::path& file) {
  const UniqueHandle<archive*, archive_read_free> reader(archive_read_new());
  archive_read_support_format_all(reader.get());
  archive_read_support_filter_all(reader.get());
  std::map<std::string, std::string> files;
  if (archive_read_open_filename(reader.get(), file.c_str(), 10'240) != ARCHIVE_OK) {
    ADD_FAILURE() << file << ": " << archive_error_string(reader.get());
    return files;
  }
  archive_entry* entry = nullptr;
  while (archive_read_next_header(reader.get(), &entry) == ARCHIVE_OK) {
    std::string& text = files[archive_entry_pathname(entry)];
    std::array<char, 4096> buffer;
    la_ssize_t count = 0;
    while ((count = archive_read_data(reader.get(), buffer.data(), buffer.size())) > 0) {
      text.append(buffer.data(), static_cast<std::size_t>(count));
    }
  }
  return files;
}

void writeArchive(const fs::path& file, const std::vector<TestEntry>& entries) {
  const UniqueHandle<archive*, archive_write_free> writer(archive_write_new());
  archive_write_set_format_pax_restricted(writer.get());
  archive_write_add_filter_zstd(writer.get());
  ASSERT_EQ(archive_write_open_filename(writer.get(), file.c_str()), ARCHIVE_OK);
  for (const TestEntry& one : entries) {
    const UniqueHandle<archive_entry*, archive_entry_free> entry(archive_entry_new());
    archive_entry_set_pathname(entry.get(), one.name.c_str());
    archive_entry_set_perm(entry.get(), 0600);
    if (one.linkTarget.empty()) {
      archive_entry_set_filetype(entry.get(), AE_IFREG);
      archive_entry_set_size(entry.get(), static_cast<la_int64_t>(one.text.size()));
    } else {
      archive_entry_set_filetype(entry.get(), AE_IFLNK);
      archive_entry_set_symlink(entry.get(), one.linkTarget.c_str());
    }
    ASSERT_EQ(archive_write_header(writer.get(), entry.get()), ARCHIVE_OK);
    archive_write_data(writer.get(), one.text.data(), one.text.size());
  }
  ASSERT_EQ(archive_write_close(writer.get()), ARCHIVE_OK);
}

SnapshotFixture::SnapshotFixture() {
  options.storageDirectory = scratch.path() / "state";
  options.paths.proc = scratch.path() / "proc";
  options.paths.alsa = scratch.path() / "asound";
  options.paths.osRelease = scratch.path() / "os-release";
  options.paths.pipeWireVersion = {"echo", "version 1"};
  options.paths.pipeWireDump = {"echo", "[]"};
  fs::create_directories(options.storageDirectory);
  fs::create_directories(options.paths.proc);
}

std::future<Dictionary> SnapshotFixture::request(const std::string& process) {
  const auto reporter = service->createReporter();
  const Dictionary signature = reporter->makeSignature("Acoustat", "haptics", "Session_Generic",
                                                       "Joulebook", process, std::nullopt);
  auto promise = std::make_shared<std::promise<Dictionary>>();
  reporter->requestSnapshot(
      signature, 0, std::nullopt, std::nullopt,
      [promise](const Dictionary& response) { promise->set_value(response); });
  return promise->get_future();
}

Dictionary SnapshotFixture::responseOf(std::future<Dictionary> response) {
  if (response.wait_for(kPatience) != std::future_status::ready) {
    ADD_FAILURE() << "no response came in time";
    return {};
  }
  return response.get();
}

std::string SnapshotFixture::textOf(const Dictionary& response, const char* key) {
  const Value* value = response.find(key);
  return value == nullptr ? std::string() : std::string(value->string());
}

std::vector<std::string> SnapshotFixture::names() const {
  std::vector<std::string> names;
  std::error_code ignored;
  for (const auto& entry : fs::directory_iterator(directory(), ignored)) {
    names.push_back(entry.path().filename().string());
  }
  std::ranges::sort(names);
  return names;
}

}  // namespace halvox::platform::linux_
