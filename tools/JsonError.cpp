#include "tools/JsonError.h"

#include <string_view>

#include <rapidjson/error/error.h>

#include "platform/linux/base/Utf8.h"
#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

constexpr std::size_t kLongestCharacter = 4;  // bytes of UTF-8

// Returns what was expected; empty for an error that is not about the next character.
std::string_view expectationOf(int code) {
  switch (static_cast<rapidjson::ParseErrorCode>(code)) {
    case rapidjson::kParseErrorValueInvalid:
      return "a value";
    case rapidjson::kParseErrorDocumentRootNotSingular:
      return "the end of the text";
    case rapidjson::kParseErrorObjectMissName:
      return "a name in double quotes";
    case rapidjson::kParseErrorObjectMissColon:
      return "\":\" after the name";
    case rapidjson::kParseErrorObjectMissCommaOrCurlyBracket:
      return "\",\" or \"}\"";
    case rapidjson::kParseErrorArrayMissCommaOrSquareBracket:
      return "\",\" or \"]\"";
    case rapidjson::kParseErrorStringMissQuotationMark:
      return "a double quote at the end of the string";
    case rapidjson::kParseErrorNumberMissFraction:
      return "a digit after the decimal point";
    case rapidjson::kParseErrorNumberMissExponent:
      return "a digit in the exponent";
    case rapidjson::kParseErrorNone:
    case rapidjson::kParseErrorDocumentEmpty:
    case rapidjson::kParseErrorStringUnicodeEscapeInvalidHex:
    case rapidjson::kParseErrorStringUnicodeSurrogateInvalid:
    case rapidjson::kParseErrorStringEscapeInvalid:
    case rapidjson::kParseErrorStringInvalidEncoding:
    case rapidjson::kParseErrorNumberTooBig:
    case rapidjson::kParseErrorTermination:
    case rapidjson::kParseErrorUnspecificSyntaxError:
      break;
  }
  return {};
}

std::string_view sentenceOf(int code) {
  switch (static_cast<rapidjson::ParseErrorCode>(code)) {
    case rapidjson::kParseErrorDocumentEmpty:
      return "expected a value, but the text is empty";
    case rapidjson::kParseErrorStringUnicodeEscapeInvalidHex:
      return "expected four hexadecimal digits after \\u";
    case rapidjson::kParseErrorStringUnicodeSurrogateInvalid:
      return "expected the second half of a surrogate pair after the first";
    case rapidjson::kParseErrorStringEscapeInvalid:
      return R"(expected one of " \ / b f n r t u after the backslash)";
    case rapidjson::kParseErrorStringInvalidEncoding:
      return "wrong encoding; expected UTF-8 without control characters in the string";
    case rapidjson::kParseErrorNumberTooBig:
      return "the number is too large";
    default:  // other codes have an expectation or give no reason
      return "this is not JSON";
  }
}

// Returns the next character of the text, for an error message.
std::string foundIn(std::istream& text) {
  std::string character;
  while (character.size() < kLongestCharacter) {
    const int byte = text.peek();
    if (byte == std::istream::traits_type::eof()) break;
    // Takes a whole character, because its first byte alone would be shown as broken text.
    if (!character.empty() && !platform::linux_::continuesUtf8(static_cast<char>(byte))) break;
    character += static_cast<char>(text.get());
  }
  if (character.empty()) return "the end of the text";
  if (character == "\n") return "the end of the line";
  return "\"" + harmlessText(character) + "\"";
}

}  // namespace

std::string describeJsonError(std::istream& text, std::size_t offset, int code,
                              const std::string& problem) {
  std::size_t line = 1;
  std::size_t column = 1;
  for (; offset > 0 && text.peek() != std::istream::traits_type::eof(); --offset) {
    const int byte = text.get();
    if (byte == '\n') {
      ++line;
      column = 1;
    } else if (!platform::linux_::continuesUtf8(static_cast<char>(byte))) {
      ++column;
    }
  }
  const std::string place =
      "line " + std::to_string(line) + ", column " + std::to_string(column) + ": ";
  // The parser's own code only says that its handler stopped it.
  if (!problem.empty()) return place + problem;
  const std::string_view expected = expectationOf(code);
  if (expected.empty()) return place + std::string(sentenceOf(code));
  return place + "expected " + std::string(expected) + ", found " + foundIn(text);
}

}  // namespace halvox::tools
