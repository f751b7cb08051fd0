#include "analysis/Payload.h"

#include <array>
#include <cmath>

#include <rapidjson/document.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

namespace halvox::analysis {
namespace {

using Allocator = rapidjson::MemoryPoolAllocator<>;
using Document = rapidjson::GenericDocument<rapidjson::UTF8<>, Allocator>;

// Most payloads fit. Parsing them allocates nothing but the parser's stack.
constexpr std::size_t kPoolBytes = 32 * 1024;
// Larger texts are rare. Their copy is not kept for the next payload.
constexpr std::size_t kKeptTextBytes = std::size_t{1} << 20U;
// Views of texts are taken from the parsed copy, and numbers are exact.
constexpr unsigned kParseFlags = rapidjson::kParseInsituFlag | rapidjson::kParseFullPrecisionFlag;
// How deeply the recursive parser may go. It is faster than the iterative one, but a payload may be
// nested deeply enough to overflow the stack.
constexpr int kMostRecursion = 100;

// Whether the text may be nested more deeply. It is nested at most once for each bracket. find() is
// many times as fast as a loop over the letters, and most payloads have only one bracket.
bool mayBeDeep(std::string_view json) {
  int rest = kMostRecursion;
  for (const char bracket : {'{', '['}) {
    for (std::size_t at = 0; (at = json.find(bracket, at)) != std::string_view::npos; ++at) {
      if (--rest < 0) return true;
    }
  }
  return false;
}

// Gives each member of an object as JSON, from the events of a parser. Writing a parsed value
// instead would recurse as deeply as the value is nested.
class MemberWriter {
 public:
  using Callback = std::function<void(std::string_view, std::string_view)>;
  using Length = rapidjson::SizeType;

  explicit MemberWriter(const Callback& callback) : callback_(callback) {}

  bool Null() { return writer_.Null() && ended(); }
  bool Bool(bool value) { return writer_.Bool(value) && ended(); }
  bool Int(int value) { return writer_.Int(value) && ended(); }
  bool Uint(unsigned value) { return writer_.Uint(value) && ended(); }
  bool Int64(std::int64_t value) { return writer_.Int64(value) && ended(); }
  bool Uint64(std::uint64_t value) { return writer_.Uint64(value) && ended(); }
  bool Double(double value) { return writer_.Double(value) && ended(); }
  bool RawNumber(const char* text, Length length, bool /*copy*/) {
    return writer_.RawNumber(text, length) && ended();
  }
  bool String(const char* text, Length length, bool /*copy*/) {
    return writer_.String(text, length) && ended();
  }
  bool StartObject() { return depth_++ == 0 || writer_.StartObject(); }
  bool StartArray() {
    ++depth_;
    return writer_.StartArray();
  }
  bool EndObject(Length /*members*/) { return --depth_ == 0 || (writer_.EndObject() && ended()); }
  bool EndArray(Length /*elements*/) {
    --depth_;
    return writer_.EndArray() && ended();
  }
  bool Key(const char* text, Length length, bool /*copy*/) {
    if (depth_ > 1) return writer_.Key(text, length);
    key_.assign(text, length);
    buffer_.Clear();
    writer_.Reset(buffer_);
    return true;
  }

 private:
  // After each value. One inside the object itself is a member.
  bool ended() {
    if (depth_ == 1) callback_(key_, {buffer_.GetString(), buffer_.GetSize()});
    return true;
  }

  const Callback& callback_;
  std::string key_;
  rapidjson::StringBuffer buffer_;
  rapidjson::Writer<rapidjson::StringBuffer> writer_{buffer_};
  std::size_t depth_ = 0;
};

}  // namespace

struct Payload::Parsed {
  alignas(16) std::array<char, kPoolBytes> pool{};
  Allocator allocator{pool.data(), pool.size()};
  std::string text;  // a copy, which the parser changes and the document refers to
  std::optional<Document> document;

  // Parsing in place saves the copy of each string. Together with the recursive parser, this made a
  // report of a million events take a quarter less time.
  void parse(std::string_view json) {
    allocator.Clear();
    if (text.capacity() > kKeptTextBytes) std::string().swap(text);
    text = json;
    document.emplace(&allocator);
    if (mayBeDeep(json)) {
      document->ParseInsitu<kParseFlags | rapidjson::kParseIterativeFlag>(text.data());
    } else {
      document->ParseInsitu<kParseFlags>(text.data());
    }
    if (document->HasParseError()) document->SetNull();
  }
  // Returns the value of a key, or nullptr.
  [[nodiscard]] const Document::ValueType* find(std::string_view key) const {
    if (!document || !document->IsObject()) return nullptr;
    const auto found =
        document->FindMember(Document::ValueType(rapidjson::StringRef(key.data(), key.size())));
    return found == document->MemberEnd() ? nullptr : &found->value;
  }
};

Payload::Payload() : parsed_(std::make_unique<Parsed>()) {}
Payload::~Payload() = default;

void Payload::show(std::string_view json) {
  json_ = json;
  parsed_->document.reset();
}

const Payload::Parsed& Payload::parsed() const {
  if (!parsed_->document.has_value()) parsed_->parse(json_);
  return *parsed_;
}

std::optional<double> Payload::number(std::string_view key) const {
  const auto* value = parsed().find(key);
  if (value == nullptr) return std::nullopt;
  if (value->IsBool()) return value->GetBool() ? 1 : 0;
  if (!value->IsNumber() || !std::isfinite(value->GetDouble())) return std::nullopt;
  return value->GetDouble();
}

std::optional<std::int64_t> Payload::integer(std::string_view key) const {
  const auto* value = parsed().find(key);
  if (value == nullptr) return std::nullopt;
  if (value->IsBool()) return value->GetBool() ? 1 : 0;
  if (!value->IsInt64()) return std::nullopt;
  return value->GetInt64();
}

std::optional<std::string_view> Payload::text(std::string_view key) const {
  const auto* value = parsed().find(key);
  if (value == nullptr || !value->IsString()) return std::nullopt;
  return std::string_view(value->GetString(), value->GetStringLength());
}

bool Payload::has(std::string_view key) const { return parsed().find(key) != nullptr; }

void Payload::forEachText(std::string_view key,
                          const std::function<void(std::string_view)>& callback) const {
  const auto* value = parsed().find(key);
  if (value == nullptr || !value->IsArray()) return;
  for (const auto& element : value->GetArray()) {
    if (element.IsString()) callback({element.GetString(), element.GetStringLength()});
  }
}

void Payload::forEachMember(
    const std::function<void(std::string_view, std::string_view)>& callback) const {
  const auto& document = parsed().document;
  if (!document || !document->IsObject()) return;
  rapidjson::Reader reader;
  rapidjson::MemoryStream stream(json_.data(), json_.size());
  MemberWriter writer(callback);
  reader.Parse<rapidjson::kParseIterativeFlag | rapidjson::kParseFullPrecisionFlag>(stream, writer);
}

}  // namespace halvox::analysis
