#include "tools/Script.h"

#include <utility>

#include "tools/CommandLine.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/RequestRunner.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;

constexpr std::string_view kBlanks = " \t\r";

// Returns the words of a line one by one.
class LineReader {
 public:
  explicit LineReader(std::string_view line) : rest_(line) {}

  // Returns false at the end of the line, or if the line has an error.
  bool next(std::string& word) {
    const auto start = rest_.find_first_not_of(kBlanks);
    rest_.remove_prefix(start == std::string_view::npos ? rest_.size() : start);
    if (rest_.empty() || rest_.front() == '#') return false;
    word.clear();
    // JSON to the end of the line, without the shell's rules: its quotes and backslashes stay.
    if (rest_.front() == '{') {
      const auto end = rest_.find_last_not_of(kBlanks);
      word = rest_.substr(0, end + 1);
      rest_ = {};
      return true;
    }
    while (!rest_.empty() && kBlanks.find(rest_.front()) == std::string_view::npos) {
      if (!takePiece(word)) return false;
    }
    return true;
  }
  // Whether the whole line could be read.
  [[nodiscard]] const Result<void>& result() const { return result_; }

 private:
  bool takePiece(std::string& word) {
    switch (rest_.front()) {
      case '\'':
        return takeQuoted('\'', word);
      case '"':
        return takeQuoted('"', word);
      case '\\':
        rest_.remove_prefix(1);
        if (rest_.empty()) return fail("a backslash ends the line");
        [[fallthrough]];
      default:  // any other character is itself
        word += rest_.front();
        rest_.remove_prefix(1);
        return true;
    }
  }

  bool takeQuoted(char quote, std::string& word) {
    rest_.remove_prefix(1);
    while (!rest_.empty() && rest_.front() != quote) {
      // As in the shell: within double quotes a backslash escapes only a quote or another
      // backslash, and within single quotes nothing.
      const bool escapes = quote == '"' && rest_.front() == '\\' && rest_.size() > 1 &&
                           (rest_[1] == '"' || rest_[1] == '\\');
      if (escapes) rest_.remove_prefix(1);
      word += rest_.front();
      rest_.remove_prefix(1);
    }
    if (rest_.empty()) return fail(std::string("the quote ") + quote + " is not closed");
    rest_.remove_prefix(1);
    return true;
  }

  bool fail(std::string reason) {
    result_ = Failure<>{std::move(reason)};
    return false;
  }

  std::string_view rest_;
  Result<void> result_;
};

ExitStatus runLine(const std::vector<std::string>& words, RequestRunner& runner, bool json,
                   std::ostream& out, std::ostream& errors, const std::string& prefix,
                   std::istream& input) {
  auto parsed = parseCommandLine(words, CommandSource::kScriptLine, input);
  if (const auto* text = std::get_if<CommandLineText>(&parsed)) {
    const bool isHelp = text->status == ExitStatus::kDone;
    (isHelp ? out : errors) << (isHelp ? "" : prefix) << text->text;
    if (!isHelp && (json || asksForJson(words))) {
      out << failureJson(text->command, {failureKind(text->status), "", text->reason}) << '\n';
    }
    return text->status;
  }
  const auto& command = std::get<Command>(parsed);
  return runner.run(*command.asked<Request>(), json || command.options.json, prefix);
}

}  // namespace

Result<std::vector<std::string>> splitLine(std::string_view line) {
  LineReader reader(line);
  std::vector<std::string> words;
  std::string word;
  while (reader.next(word)) words.push_back(word);
  if (!reader.result()) return reader.result().error();
  return words;
}

ExitStatus runScript(const ScriptSource& source, const CommonOptions& options, std::ostream& out,
                     std::ostream& errors) {
  RequestRunner runner(options, out, errors);
  ExitStatus result = ExitStatus::kDone;
  std::string line;
  for (std::size_t number = 1;; ++number) {
    if (source.isPrompting) out << "halvox> ";
    // Show the answers of a line before the next line is read, because reading from a pipe may take
    // long.
    out << std::flush;
    if (!std::getline(source.lines, line)) break;

    const std::string prefix = source.name + ":" + std::to_string(number) + ": ";
    ExitStatus status = ExitStatus::kDone;
    auto words = splitLine(line);
    if (!words) {
      errors << prefix << harmlessText(words.error().message) << '\n';
      if (options.json) {
        const auto kind = failureKind(ExitStatus::kBadArguments);
        out << failureJson("", {kind, "", words.error().message}) << '\n';
      }
      status = ExitStatus::kBadArguments;
    } else {
      if (words->empty()) continue;
      if (words->front() == "quit" || words->front() == "exit") break;
      if (words->front() == "help") words->front() = "--help";
      status = runLine(*words, runner, options.json, out, errors, prefix, source.lines);
    }
    if (result == ExitStatus::kDone) result = status;
    // This ends the script even with --keep-going, because its sessions have ended with the
    // connection.
    if (status == ExitStatus::kNoService) break;
    if (status != ExitStatus::kDone && !source.keepsGoing) break;
  }
  if (source.isPrompting) out << '\n';
  return result;
}

}  // namespace halvox::tools
