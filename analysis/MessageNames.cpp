#include "analysis/MessageNames.h"

#include <algorithm>

#include "client/Vocabulary.h"

namespace halvox::analysis {
namespace {

constexpr std::string_view kPrefix = "com.tarno.";
constexpr std::string_view kSessionSuffix = "_session";
constexpr const char* kTag = "audiotag";
constexpr client::Category kCategoryProper = 0xFFFF;

// Whether a text is "", "_" for a domain without a name, or the name of a domain and "_".
bool isDomain(std::string_view text) {
  if (text.empty() || text == "_") return true;
  if (!text.ends_with('_')) return false;
  text.remove_suffix(1);
  return std::ranges::any_of(client::domains(),
                             [&](const auto& domain) { return domain.name == text; });
}

}  // namespace

EventNameParts splitEventName(std::string_view name) {
  if (!name.starts_with(kPrefix)) return {};
  name.remove_prefix(kPrefix.size());
  const std::size_t first = name.find('.');
  if (first == std::string_view::npos) return {};
  const std::size_t second = name.find('.', first + 1);
  if (second == std::string_view::npos) return {};
  return {name.substr(0, first), name.substr(first + 1, second - first - 1),
          name.substr(second + 1)};
}

std::string_view linkServiceType(std::string_view serviceName) {
  if (serviceName.ends_with(kSessionSuffix)) serviceName.remove_suffix(kSessionSuffix.size());
  return serviceName;
}

LinkMessageNames linkMessageNames(std::int64_t category, std::int64_t type,
                                  const Payload& payload) {
  const std::string proper =
      client::categoryName(static_cast<client::Category>(category) & kCategoryProper);
  const std::string_view typeName = client::eventTypeName(static_cast<client::EventType>(type));
  LinkMessageNames names{.category = proper, .type = typeName};
  // Clients write payloads. The tag counts only if it fits the numbers.
  std::string_view tag = payload.text(kTag).value_or(std::string_view());
  if (!tag.ends_with(typeName)) return names;
  tag.remove_suffix(typeName.size());
  if (!tag.ends_with(proper)) return names;
  if (isDomain(tag.substr(0, tag.size() - proper.size()))) names.category = tag;
  return names;
}

}  // namespace halvox::analysis
