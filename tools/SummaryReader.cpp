#include "tools/SummaryReader.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <vector>

#include <rapidjson/filereadstream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>
#include <sys/stat.h>

#include "platform/linux/base/ErrnoText.h"
#include "tools/JsonError.h"

namespace halvox::tools {
namespace {

using platform::linux_::errnoText;
using platform::linux_::Failure;
using platform::linux_::Result;

constexpr std::string_view kTimePattern = "dddddddd-ddddddsdddd";
constexpr std::string_view kMark = "-halvox-";
constexpr std::string_view kEnding = ".json";
constexpr std::string_view kTimestampKey = "hvreporting_timestamp";
constexpr std::string_view kVolumeInterval = "Volume_Summary_";
constexpr std::size_t kBufferBytes = 64 * 1024;
// Both are far beyond any message of the service.
constexpr std::size_t kLongestMessage = 64 * 1024 * 1024;
constexpr std::size_t kDeepestNesting = 256;

bool fits(char character, char pattern) {
  if (pattern == 'd') return character >= '0' && character <= '9';
  if (pattern == 's') return character == '+' || character == '-';
  return character == pattern;
}

bool isTime(std::string_view text) {
  if (text.size() != kTimePattern.size()) return false;
  for (std::size_t index = 0; index < text.size(); ++index) {
    if (!fits(text[index], kTimePattern[index])) return false;
  }
  return true;
}

int number(std::string_view digits) { return std::atoi(std::string(digits).c_str()); }

bool parseTimeOfName(std::string_view text, SummaryName& name) {
  using namespace std::chrono;
  if (!isTime(text)) return false;
  const year_month_day date{year(number(text.substr(0, 4))),
                            month(static_cast<unsigned>(number(text.substr(4, 2)))),
                            day(static_cast<unsigned>(number(text.substr(6, 2))))};
  const int hour = number(text.substr(9, 2));
  const int minute = number(text.substr(11, 2));
  const int second = number(text.substr(13, 2));
  // 60 is a leap second.
  if (!date.ok() || hour > 23 || minute > 59 || second > 60) return false;
  const auto offset = hours(number(text.substr(16, 2))) + minutes(number(text.substr(18, 2)));
  const auto local =
      sys_days(date).time_since_epoch() + hours(hour) + minutes(minute) + seconds(second);
  const seconds utc = text[15] == '-' ? local + offset : local - offset;
  name.secondsSince1970 = utc.count();
  const auto part = [&](std::size_t at, std::size_t length) {
    return std::string(text.substr(at, length));
  };
  name.time = part(0, 4) + "-" + part(4, 2) + "-" + part(6, 2) + " " + part(9, 2) + ":" +
              part(11, 2) + ":" + part(13, 2) + " " + part(15, 5);
  return true;
}

// Parses a summary: an array of objects with one entry each, whose value is an object. Writes each
// message to one line while it reads it.
class SummaryHandler {
 public:
  SummaryHandler(const SummaryMessageHandler& onMessage, SummaryTotals& totals)
      : onMessage_(onMessage), totals_(totals) {}

  [[nodiscard]] const std::string& problem() const { return problem_; }

  bool Null() {
    return value([&] { return writer_.Null(); });
  }
  bool Bool(bool flag) {
    return value([&] { return writer_.Bool(flag); });
  }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    // Only the time stamp at the top of the message counts. A nested dictionary may have a key of
    // the same name.
    if (depth_ == kInMessage && isTimestamp_) noteTime(std::string(text, length));
    return value([&] { return writer_.RawValue(text, length, rapidjson::kNumberType); });
  }
  bool String(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return value([&] { return writer_.String(text, length); });
  }
  bool StartObject() {
    if (depth_ == 0) return fail("expected an array of messages");
    if (++depth_ == kInEntry) return beginEntry();
    // The buffer keeps its memory from message to message.
    if (depth_ == kInMessage) buffer_.Clear(), writer_.Reset(buffer_);
    if (depth_ > kDeepestNesting) return fail("a message is nested too deep");
    return writer_.StartObject();
  }
  bool Key(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    if (depth_ == kInEntry) return beginMessage({text, length});
    if (depth_ == kInMessage) isTimestamp_ = std::string_view(text, length) == kTimestampKey;
    return withinLimit() && writer_.Key(text, length);
  }
  bool EndObject(rapidjson::SizeType /*members*/) {
    const std::size_t left = depth_--;
    if (left == kInEntry) return hasMessage_ || fail("an entry has no message");
    if (!writer_.EndObject()) return false;
    if (left == kInMessage) endMessage();
    return true;
  }
  bool StartArray() {
    ++depth_;
    if (depth_ == 1) return true;
    if (depth_ <= kInMessage) return fail("a message is not an object");
    if (depth_ > kDeepestNesting) return fail("a message is nested too deep");
    return writer_.StartArray();
  }
  bool EndArray(rapidjson::SizeType /*elements*/) { return --depth_ == 0 || writer_.EndArray(); }
  // The parser delivers numbers as text, so that they keep their digits.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(std::int64_t) { return false; }
  bool Uint64(std::uint64_t) { return false; }
  bool Double(double) { return false; }

 private:
  // The number of open arrays and objects when the parser is in an entry, and in its message.
  static constexpr std::size_t kInEntry = 2;
  static constexpr std::size_t kInMessage = 3;

  template <typename Write>
  bool value(Write write) {
    if (depth_ == 0) return fail("expected an array of messages");
    if (depth_ < kInMessage) return fail("a message is not an object");
    return withinLimit() && write();
  }

  bool withinLimit() {
    return buffer_.GetSize() <= kLongestMessage || fail("a message is too long");
  }

  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }

  bool beginEntry() {
    hasMessage_ = false;
    return true;
  }

  bool beginMessage(std::string_view identifier) {
    if (hasMessage_) return fail("an entry has more than one message");
    hasMessage_ = true;
    identifier_ = identifier;
    return true;
  }

  void endMessage() {
    ++totals_.messages;
    if (identifier_.starts_with(kVolumeInterval)) ++totals_.volumeIntervals;
    if (onMessage_) onMessage_(identifier_, {buffer_.GetString(), buffer_.GetSize()});
    isTimestamp_ = false;
  }

  void noteTime(const std::string& text) {
    const double time = std::strtod(text.c_str(), nullptr);
    if (!firstTime_) firstTime_ = time;
    totals_.seconds = time - *firstTime_;
  }

  const SummaryMessageHandler& onMessage_;
  SummaryTotals& totals_;
  std::size_t depth_ = 0;
  bool hasMessage_ = false;
  bool isTimestamp_ = false;
  std::string identifier_;
  std::optional<double> firstTime_;
  rapidjson::StringBuffer buffer_;
  rapidjson::Writer<rapidjson::StringBuffer> writer_{buffer_};
  std::string problem_;
};

struct CloseFile {
  void operator()(std::FILE* file) const { static_cast<void>(std::fclose(file)); }
};
using File = std::unique_ptr<std::FILE, CloseFile>;

// Opens a regular file. Fails for directories, and for pipes, which might never end.
Result<File> openFile(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return Failure<>{errnoText(errno)};
  if (!S_ISREG(status.st_mode)) return Failure<>{"is not a file"};
  File file(std::fopen(path.c_str(), "rbe"));
  if (file == nullptr) return Failure<>{errnoText(errno)};
  return file;
}

}  // namespace

std::optional<SummaryName> parseSummaryName(std::string_view name) {
  SummaryName parsed;
  if (!name.ends_with(kEnding)) return std::nullopt;
  name.remove_suffix(kEnding.size());
  if (!parseTimeOfName(name.substr(0, kTimePattern.size()), parsed)) return std::nullopt;
  name.remove_prefix(kTimePattern.size());
  if (!name.starts_with(kMark)) return std::nullopt;
  name.remove_prefix(kMark.size());
  // The last hyphen is the one before the service, because names of services have no hyphen.
  const std::size_t hyphen = name.rfind('-');
  if (hyphen == std::string_view::npos) return std::nullopt;
  parsed.application = name.substr(0, hyphen);
  parsed.service = name.substr(hyphen + 1);
  return parsed;
}

Result<SummaryTotals> readSummary(const std::string& path, const SummaryMessageHandler& handler) {
  // Numbers as texts keep the digits that the service wrote. Iterative, because a file may be
  // nested deeper than the stack allows.
  constexpr unsigned kFlags = rapidjson::kParseNumbersAsStringsFlag |
                              rapidjson::kParseIterativeFlag |
                              rapidjson::kParseValidateEncodingFlag;
  const Result<File> opened = openFile(path);
  if (!opened) return opened.error();
  std::FILE* const file = opened->get();
  std::vector<char> buffer(kBufferBytes);
  rapidjson::FileReadStream stream(file, buffer.data(), buffer.size());
  SummaryTotals totals;
  SummaryHandler summary(handler, totals);
  rapidjson::Reader reader;
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, summary);
  // Tested before the parser's result, because to the parser a read error looks like the end of the
  // file.
  if (std::ferror(file) != 0) return Failure<>{"cannot be read"};
  if (!result.IsError()) return totals;
  // Opened again, because the place of an error is counted from the beginning.
  std::ifstream text(path, std::ios::binary);
  return Failure<>{"is not a summary: " +
                   describeJsonError(text, result.Offset(), result.Code(), summary.problem())};
}

}  // namespace halvox::tools
