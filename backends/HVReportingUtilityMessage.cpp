#include <algorithm>

#include "backends/HVReportingUtility.h"

namespace halvox {

using platform::Dictionary;
using platform::Key;
using platform::Value;

platform::Value HVReportingUtilityRetrieveAppName(const Dictionary& dictionary) {
  static const Key key("HostApplicationDisplayID");
  const Value* name = dictionary.find(key);
  // A value of any kind is returned unchanged, because clients may put a number there.
  return name == nullptr ? Value("Unknown") : *name;
}

Dictionary HVReportingUtilityAddAudioMessageTag(const Dictionary& dictionary,
                                                AudioEventCategory category, AudioEventType type) {
  static const Key key("audiotag");
  const HVReportingCategoryText categoryText = HVReportingUtilityCategoryTextParts(category);
  const std::string_view typeText = HVReportingUtilityTypeString(type);
  std::string tag;
  tag.reserve(categoryText.domain.size() + categoryText.name.size() + typeText.size());
  tag += categoryText.domain;
  tag += categoryText.name;
  tag += typeText;

  Dictionary tagged = dictionary;
  tagged.set(key, tag);
  return tagged;
}

Dictionary HVReportingUtilityRemoveWhiteSpaceFromKeys(const Dictionary& dictionary) {
  const auto hasBlank = [](const Dictionary::Entry& entry) { return entry.key.hasBlank(); };
  // Nearly every message returns here. The test is cheap, because a key remembers whether it has a
  // blank.
  if (std::none_of(dictionary.begin(), dictionary.end(), hasBlank)) return dictionary;

  Dictionary cleaned;
  cleaned.reserve(dictionary.size());
  for (const Dictionary::Entry& entry : dictionary) {
    if (!entry.key.hasBlank()) {
      cleaned.set(entry.key, entry.value);
      continue;
    }
    std::string text(entry.key.text());
    std::ranges::replace(text, ' ', '_');
    cleaned.set(text, entry.value);
  }
  return cleaned;
}

}  // namespace halvox
