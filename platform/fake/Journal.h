#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform {

// The kind of a journal entry; the comments say what its text is.
enum class JournalKind : unsigned char {
  kLogLine,          // text: the line without its prefix
  kTracePoint,       // text: the code, such as "0x21044828"
  kAnalyticsTest,    // text: the name that was tested
  kAnalyticsEvent,   // text: the name that was sent
  kMetric,           // text: the metric's identifier in decimal digits
  kPowerEvent,       // text: the event's name
  kSnapshotRequest,  // text: the signature's description
  kLink,             // text: the call of the real-time framework, such as "send session 1 4/1"
  kFile,             // text: the call for a directory or file, such as "file /a/b.json"
  kReply,            // text: the name of the method that was answered
  kTermination,      // text: the exit status
  kNote,             // text: what the test passed to note()
};

struct JournalEntry {
  JournalKind kind;
  std::string text;
  friend bool operator==(const JournalEntry&, const JournalEntry&) = default;
};

// Records the order in which calls reach all the fakes. Tests use it to check the order of steps
// that go to different services. Any thread may record. FakePlatform owns it; it must outlive the
// fakes.
class Journal {
 public:
  void record(JournalKind kind, std::string_view text);
  // Lets a test mark its own steps.
  void note(std::string_view text) { record(JournalKind::kNote, text); }
  void clear();
  // Installs a handler that runs after each entry, on the recording thread, so that a test can look
  // at the state between two entries.
  void whenRecorded(std::function<void(const JournalEntry&)> handler);

  [[nodiscard]] std::vector<JournalEntry> entries() const;
  // The entries of these kinds, in the order of recording.
  [[nodiscard]] std::vector<JournalEntry> entries(std::initializer_list<JournalKind> kinds) const;
  // The texts of all entries, or of the entries of one kind, in the order of recording.
  [[nodiscard]] std::vector<std::string> texts() const;
  [[nodiscard]] std::vector<std::string> texts(JournalKind kind) const;

 private:
  mutable std::mutex mutex_;
  std::vector<JournalEntry> entries_;
  std::function<void(const JournalEntry&)> handler_;
};

// Prints an entry in the message of a failed test.
void PrintTo(const JournalEntry& entry, std::ostream* stream);

}  // namespace halvox::platform
