#include "analysis/Payload.h"

#include <array>
#include <cmath>

#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

namespace halvox::analysis {
namespace {

using Allocator = rapidjson::MemoryPoolAllocator<>;
using Document = rapidjson::GenericDocument<rapidjson::UTF8<>, Allocator>;

// Most payloads fit. Parsing them allocates nothing but the parser's stack.
constexpr std::size_t kPoolBytes = 32 * 1024;
// The parser is the iterative one, because a payload may be nested deeply and the recursive parser
// would overflow the stack.
constexpr unsigned kParseFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseFullPrecisionFlag;

}  // namespace

struct Payload::Parsed {
  alignas(16) std::array<char, kPoolBytes> pool{};
  Allocator allocator{pool.data(), pool.size()};
  std::optional<Document> document;

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
  if (!parsed_->document.has_value()) {
    parsed_->allocator.Clear();
    parsed_->document.emplace(&parsed_->allocator);
    parsed_->document->Parse<kParseFlags>(json_.data(), json_.size());
    if (parsed_->document->HasParseError()) parsed_->document->SetNull();
  }
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
  rapidjson::StringBuffer buffer;
  for (const auto& member : document->GetObject()) {
    buffer.Clear();
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    member.value.Accept(writer);
    callback({member.name.GetString(), member.name.GetStringLength()},
             {buffer.GetString(), buffer.GetSize()});
  }
}

}  // namespace halvox::analysis
