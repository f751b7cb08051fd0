// Makes the reader and the writer of the issue metric available to other programs. Prints one
// message a line: timestamp ("-" for none), duration, and the three texts in hexadecimal digits.
//
//   write COUNT   prints COUNT random messages, each after its encoded bytes
//   read          reads encoded messages, one a line in hexadecimal digits; prints each after "ok",
//                 or after "error" with the fields before the error

#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "backends/AudioIssueDetected.h"
#include "backends/testdata/RandomIssue.h"

namespace halvox::zubmetrics {
namespace {

std::string hex(std::span<const std::byte> bytes) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text;
  for (const std::byte byte : bytes) {
    text += kDigits[std::to_integer<unsigned>(byte) >> 4U];
    text += kDigits[std::to_integer<unsigned>(byte) & 15U];
  }
  return text;
}

std::vector<std::byte> bytesOf(std::string_view digits) {
  std::vector<std::byte> bytes(digits.size() / 2);
  for (std::size_t index = 0; index < bytes.size(); ++index) {
    unsigned value = 0;
    const char* begin = digits.data() + index * 2;
    std::from_chars(begin, begin + 2, value, 16);
    bytes[index] = static_cast<std::byte>(value);
  }
  return bytes;
}

void print(std::string_view front, const AudioIssueDetected& issue) {
  std::cout << front << '\t';
  if (const auto timestamp = issue.timestamp()) {
    std::cout << *timestamp;
  } else {
    std::cout << '-';
  }
  std::cout << '\t' << issue.duration();
  for (const std::string& text : {issue.issueType(), issue.node(), issue.rtaidClient()}) {
    std::cout << '\t' << hex(std::as_bytes(std::span(text)));
  }
  std::cout << '\n';
}

void write(int count) {
  constexpr std::uint64_t kSeed = 7;
  constexpr std::size_t kLongestText = 300;
  RandomIssues issues(kSeed, kLongestText);
  for (; count > 0; --count) {
    const AudioIssueDetected issue = issues.next();
    platform::ProtoWriter writer;
    issue.writeTo(writer);
    print(hex(writer.bytes()), issue);
  }
}

void readLines() {
  for (std::string line; std::getline(std::cin, line);) {
    const std::vector<std::byte> bytes = bytesOf(line);
    platform::ProtoReader reader(bytes);
    AudioIssueDetected issue;
    const bool wasRead = issue.readFrom(reader);
    print(wasRead ? "ok" : "error", issue);
  }
}

}  // namespace
}  // namespace halvox::zubmetrics

int main(int count, char** arguments) {
  const std::string_view mode = count > 1 ? arguments[1] : "";
  if (mode == "write" && count == 3) {
    halvox::zubmetrics::write(std::atoi(arguments[2]));
  } else if (mode == "read") {
    halvox::zubmetrics::readLines();
  } else {
    return 2;
  }
}
