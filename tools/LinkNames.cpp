#include "tools/LinkNames.h"

#include <algorithm>
#include <optional>
#include <string_view>

#include <rapidjson/document.h>

#include "client/Vocabulary.h"
#include "platform/linux/store/RecordTables.h"

namespace halvox::tools {
namespace {

using client::Category;
using platform::linux_::StoredRecord;
namespace store = platform::linux_;

constexpr const char* kTag = "audiotag";
constexpr Category kCategoryProper = 0xFFFF;

Category categoryProperOf(const StoredRecord& message) {
  return static_cast<Category>(message.number(store::kLinkCategory)) & kCategoryProper;
}

client::EventType typeOf(const StoredRecord& message) {
  return static_cast<client::EventType>(message.number(store::kLinkType));
}

std::string tagOf(const StoredRecord& message) {
  const std::string& payload = message.text(store::kLinkPayload);
  rapidjson::Document document;
  // The parser is the iterative one, because a payload may be nested deeply and the recursive
  // parser would overflow the stack.
  document.Parse<rapidjson::kParseIterativeFlag>(payload.data(), payload.size());
  if (document.HasParseError() || !document.IsObject()) return {};
  if (!document.HasMember(kTag) || !document[kTag].IsString()) return {};
  const rapidjson::Value& tag = document[kTag];
  return {tag.GetString(), tag.GetStringLength()};
}

// Returns the part before the category proper in the name of a category: "Session_", "_" for a
// domain without a name, or nothing.
std::string domainOf(Category category) {
  const std::string name = client::categoryName(category);
  // The name of a category is that of its domain followed by that of its low half.
  return name.substr(0, name.size() - client::categoryName(category & kCategoryProper).size());
}

bool isDomain(std::string_view text) {
  return text == "_" || std::ranges::any_of(client::domains(), [&](const auto& domain) {
           return text == std::string(domain.name) + "_";
         });
}

// Returns the domain in the message's tag; nothing if the tag does not agree with the numbers.
std::string domainOf(const StoredRecord& message) {
  const std::string tag = tagOf(message);
  const std::string rest = client::categoryName(categoryProperOf(message)) +
                           std::string(client::eventTypeName(typeOf(message)));
  // A message of the link carries what its client wrote; the tag counts only if it fits the
  // numbers.
  if (!tag.ends_with(rest)) return {};
  const std::string domain = tag.substr(0, tag.size() - rest.size());
  return isDomain(domain) ? domain : std::string();
}

}  // namespace

std::string linkCategoryName(const StoredRecord& message) {
  const Category category = categoryProperOf(message);
  const std::string name = client::categoryName(category);
  // Numbers without a name share the name "Undefined", which would not find them again.
  const bool isNamed = client::findCategory(name) == category;
  return domainOf(message) + (isNamed ? name : std::to_string(category));
}

std::string linkTypeName(const StoredRecord& message) {
  std::string name(client::eventTypeName(typeOf(message)));
  if (client::findEventType(name) == typeOf(message)) return name;
  return std::to_string(message.number(store::kLinkType));
}

bool isOfCategory(const StoredRecord& message, std::span<const std::int64_t> categories) {
  return categories.empty() || std::ranges::any_of(categories, [&](std::int64_t wanted) {
           const auto category = static_cast<Category>(wanted);
           const std::string domain = domainOf(category);
           return (category & kCategoryProper) == categoryProperOf(message) &&
                  (domain.empty() || domain == domainOf(message));
         });
}

}  // namespace halvox::tools
