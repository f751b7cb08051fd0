#include "platform/linux/store/IndentedJsonArray.h"

#include <string>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "platform/linux/store/PayloadEncoder.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kIndent = 2;
constexpr std::size_t kObjectDepth = 2;  // of each object: it is in the array, and under its key

// Returns the position after the closing quote of the string that begins at `begin`.
std::size_t endOfString(std::string_view json, std::size_t begin) {
  std::size_t at = begin + 1;
  while (json[at] != '"') at += json[at] == '\\' ? 2 : 1;
  return at + 1;
}

bool closes(char character) { return character == '}' || character == ']'; }

}  // namespace

class IndentedJsonArray::Text {
 public:
  void append(std::string_view key, const Dictionary& object) {
    text_ += isEmpty_ ? "[\n  {\n    " : ",\n  {\n    ";
    isEmpty_ = false;
    appendKey(key);
    text_ += ": ";
    indent(encoder_.encode(object));
    text_ += "\n  }";
  }
  void end() { text_ += isEmpty_ ? "[]\n" : "\n]\n"; }

  std::string_view take() {
    isTaken_ = true;
    return text_;
  }
  // Discards the text that the caller has taken. Called only just before new text is appended,
  // because the caller may read the old text until then.
  void begin() {
    if (isTaken_) text_.clear();
    isTaken_ = false;
  }

 private:
  // Writes the key without making it a Key of a Dictionary: Key keeps its texts in a bounded table
  // until the process ends, and keys that differ each time would fill that table.
  void appendKey(std::string_view key) {
    key_.Clear();
    rapidjson::Writer<rapidjson::StringBuffer> writer(key_);
    writer.String(key.data(), static_cast<rapidjson::SizeType>(key.size()));
    text_.append(key_.GetString(), key_.GetSize());
  }

  // Appends compact JSON, and inserts line breaks and indents. Does not parse the text, because the
  // encoder's text is well-formed and parsing would be slower. Speed matters: the stop of a session
  // waits for this function, and every other request waits for the stop.
  void indent(std::string_view json) {
    std::size_t depth = kObjectDepth;
    for (std::size_t at = 0; at < json.size(); ++at) {
      const char character = json[at];
      if (character == '"') {
        const std::size_t end = endOfString(json, at);
        text_.append(json, at, end - at);
        at = end - 1;
      } else if (character == '{' || character == '[') {
        text_ += character;
        if (closes(json[at + 1])) {
          text_ += json[++at];
        } else {
          breakLine(++depth);
        }
      } else if (closes(character)) {
        breakLine(--depth);
        text_ += character;
      } else if (character == ',') {
        text_ += character;
        breakLine(depth);
      } else if (character == ':') {
        text_ += ": ";
      } else {
        text_ += character;
      }
    }
  }

  void breakLine(std::size_t depth) {
    text_ += '\n';
    text_.append(depth * kIndent, ' ');
  }

  PayloadEncoder encoder_;
  rapidjson::StringBuffer key_;
  std::string text_;
  bool isEmpty_ = true;
  bool isTaken_ = false;
};

IndentedJsonArray::IndentedJsonArray() : text_(std::make_unique<Text>()) {}
IndentedJsonArray::~IndentedJsonArray() = default;

void IndentedJsonArray::appendObject(std::string_view key, const Dictionary& value) {
  text_->begin();
  text_->append(key, value);
}

void IndentedJsonArray::end() {
  text_->begin();
  text_->end();
}

std::string_view IndentedJsonArray::takeText() { return text_->take(); }

}  // namespace halvox::platform::linux_
