#include "platform/linux/store/IndentedJsonArray.h"

#include <rapidjson/memorystream.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>

#include "platform/linux/store/PayloadEncoder.h"

namespace halvox::platform::linux_ {
namespace {

constexpr unsigned kIndent = 2;

// Passes numbers on as they stand; RapidJSON's own way would put them between quotes.
class Writer : public rapidjson::PrettyWriter<rapidjson::StringBuffer> {
 public:
  using PrettyWriter::PrettyWriter;
  bool RawNumber(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return RawValue(text, length, rapidjson::kNumberType);
  }
};

}  // namespace

class IndentedJsonArray::Text {
 public:
  Text() {
    writer_.SetIndent(' ', kIndent);
    writer_.StartArray();
  }

  // The encoder's text is read again only to be indented, so that there is one set of rules.
  void append(const Dictionary& object) {
    constexpr unsigned kFlags =
        rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseIterativeFlag;
    const std::string_view compact = encoder_.encode(object);
    rapidjson::MemoryStream stream(compact.data(), compact.size());
    reader_.Parse<kFlags>(stream, writer_);
  }
  void end() {
    writer_.EndArray();
    buffer_.Put('\n');
  }
  std::string_view take() {
    if (isTaken_) buffer_.Clear();
    isTaken_ = true;
    return {buffer_.GetString(), buffer_.GetSize()};
  }
  // Lets go of what was taken, before anything is added.
  void begin() {
    if (isTaken_) buffer_.Clear();
    isTaken_ = false;
  }

 private:
  PayloadEncoder encoder_;
  rapidjson::Reader reader_;
  rapidjson::StringBuffer buffer_;
  Writer writer_{buffer_};
  bool isTaken_ = false;
};

IndentedJsonArray::IndentedJsonArray() : text_(std::make_unique<Text>()) {}
IndentedJsonArray::~IndentedJsonArray() = default;

void IndentedJsonArray::appendObject(std::string_view key, const Dictionary& value) {
  text_->begin();
  text_->append(Dictionary{{Key(key), Value(value)}});
}

void IndentedJsonArray::end() {
  text_->begin();
  text_->end();
}

std::string_view IndentedJsonArray::takeText() { return text_->take(); }

}  // namespace halvox::platform::linux_
