#include "client/Vocabulary.h"

#include <algorithm>

namespace halvox::client {
namespace {

constexpr Category kDomainMask = 0xFFFF0000;
constexpr Category kLastWithDomain = 0xFFFFFFFE;
constexpr std::string_view kUndefined = "Undefined";

constexpr std::array<NamedNumber, 6> kDomains{{
    {"MIDI", 0x04000000},
    {"Session", 0x08000000},
    {"DSP", 0x10000000},
    {"HAL", 0x20000000},
    {"Routing", 0x40000000},
    {"Toolbox", 0x80000000},
}};

constexpr std::array<NamedNumber, 15> kCategories{{
    {"Generic", 1},
    {"Record", 2},
    {"Input", 3},
    {"Playback", 4},
    {"Output", 5},
    {"PlaybackAndRecord", 6},
    {"IO", 7},
    {"Setup", 8},
    {"ClientRequest", 9},
    {"RouteChange", 10},
    {"Error", 11},
    {"IOReporting", 12},
    {"Performance", 13},
    {"Volume", 14},
    {"HearingHealth", 15},
}};

constexpr std::array<NamedNumber, 19> kEventTypes{{
    {"Start", 1},          {"Stop", 2},
    {"Activate", 3},       {"Deactivate", 4},
    {"Setup", 5},          {"Error", 6},
    {"IssueDetector", 7},  {"Joulebook", 8},
    {"AudioUnitUsage", 9}, {"MIDIDriver", 10},
    {"Summary", 11},       {"HeadphoneAudioExposure", 12},
    {"AudioExposure", 13}, {"Listeningenhancement", 14},
    {"Dorvan", 15},        {"Simple", 16},
    {"Histogram", 17},     {"State", 18},
    {"Unknown", 65535},
}};

constexpr std::array<NamedNumber, 15> kServiceTypes{{
    {"generic", 0},
    {"quillo", 1},
    {"telephony", 2},
    {"haptics", 3},
    {"alarms", 4},
    {"standalone", 5},
    {"soundautoconfig", 6},
    {"longformaudio", 7},
    {"nonlongformaudio", 8},
    {"audiodeviceusage", 9},
    {"alerts", 10},
    {"test", 11},
    {"apiusage", 12},
    {"systemsounds", 13},
    {"unknown", 65535},
}};

constexpr char lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool equalIgnoringCase(std::string_view left, std::string_view right) {
  return std::ranges::equal(left, right, {}, lower, lower);
}

std::optional<std::uint32_t> find(std::span<const NamedNumber> table, std::string_view name) {
  const auto found = std::ranges::find_if(
      table, [&](const NamedNumber& entry) { return equalIgnoringCase(entry.name, name); });
  if (found == table.end()) return std::nullopt;
  return found->number;
}

std::string_view nameOf(std::span<const NamedNumber> table, std::uint32_t number,
                        std::string_view otherwise) {
  const auto found = std::ranges::find(table, number, &NamedNumber::number);
  return found == table.end() ? otherwise : found->name;
}

// Every category without a name (apart from its domain) is called "Undefined". The number 0 stands
// for all of them.
std::optional<std::uint32_t> findCategoryProper(std::string_view name) {
  if (equalIgnoringCase(name, kUndefined)) return 0;
  return find(kCategories, name);
}

}  // namespace

std::span<const NamedNumber> domains() { return kDomains; }
std::span<const NamedNumber> categories() { return kCategories; }
std::span<const NamedNumber> eventTypes() { return kEventTypes; }
std::span<const NamedNumber> serviceTypes() { return kServiceTypes; }

std::string categoryName(Category category) {
  std::string name;
  if ((category & kDomainMask) != 0 && category <= kLastWithDomain) {
    name = nameOf(kDomains, category & kDomainMask, "");
    name += '_';
  }
  return name.append(nameOf(kCategories, category & ~kDomainMask, kUndefined));
}

std::string_view eventTypeName(EventType type) { return nameOf(kEventTypes, type, "Generic"); }

std::string_view serviceTypeName(ServiceType type) {
  return nameOf(kServiceTypes, type, "telephony");
}

std::optional<Category> findCategory(std::string_view name) {
  const auto separator = name.find('_');
  if (separator == std::string_view::npos) return findCategoryProper(name);
  const auto domain = find(kDomains, name.substr(0, separator));
  const auto category = findCategoryProper(name.substr(separator + 1));
  if (!domain || !category) return std::nullopt;
  return *domain | *category;
}

std::optional<EventType> findEventType(std::string_view name) {
  const auto number = find(kEventTypes, name);
  if (!number) return std::nullopt;
  return static_cast<EventType>(*number);
}

std::optional<ServiceType> findServiceType(std::string_view name) {
  const auto number = find(kServiceTypes, name);
  if (!number) return std::nullopt;
  return static_cast<ServiceType>(*number);
}

}  // namespace halvox::client
