#include "reporters/pipewire/StreamProperties.h"

#include <algorithm>
#include <array>
#include <initializer_list>

#include "reporters/pipewire/ReportingVocabulary.h"
#include "reporters/pipewire/StreamValues.h"

namespace halvox::pipewire_reporter {
namespace {

struct KeyName {
  std::string_view property;
  const char* key;
};

constexpr std::array kTexts{
    // PipeWire itself does not set this property, but some programs do.
    KeyName{"application.desktop", "desktop_entry"},
    KeyName{"application.id", "application_id"},
    KeyName{"application.name", "application_name"},
    KeyName{"application.process.binary", "process_binary"},
    KeyName{"application.process.user", "process_user"},
    KeyName{"client.api", "client_api"},
    KeyName{"media.category", "media_category"},
    KeyName{"media.class", "media_class"},
    KeyName{"media.name", "media_name"},
    KeyName{"media.role", "media_role"},
    KeyName{"node.description", "node_description"},
    KeyName{"node.latency", "node_latency"},
    KeyName{"node.name", "node_name"},
    // The server sets this property for sandboxed applications, such as those of Flatpak.
    KeyName{"pipewire.access.portal.app_id", "portal_app_id"},
};

constexpr std::array kNumbers{
    KeyName{"application.process.id", "process_id"},
    KeyName{"object.serial", kSerialKey},
};

struct RoleService {
  std::string_view role;
  ServiceType type;
};

constexpr std::array kRoles{
    RoleService{"communication", kServiceTelephony},
    RoleService{"phone", kServiceTelephony},
    RoleService{"music", kServiceLongFormAudio},
    RoleService{"movie", kServiceLongFormAudio},
    RoleService{"game", kServiceNonLongFormAudio},
    RoleService{"production", kServiceNonLongFormAudio},
    RoleService{"notification", kServiceAlerts},
    RoleService{"event", kServiceAlerts},
    RoleService{"alarm", kServiceAlarms},
    RoleService{"", kServiceGeneric},
};

char lowerCase(char letter) {
  return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
}

bool equalIgnoringCase(std::string_view left, std::string_view right) {
  return std::ranges::equal(left, right, {}, lowerCase, lowerCase);
}

// Returns the text of the first of these properties that is not empty.
std::string firstText(const Properties& properties, std::initializer_list<const char*> keys) {
  for (const char* key : keys) {
    // An empty text counts as missing, because a stream may have an empty name although its client
    // has a name.
    if (const auto text = property(properties, key); !text.empty()) {
      return cleanText(text);
    }
  }
  return {};
}

}  // namespace

std::string_view property(const Properties& properties, std::string_view key) {
  const auto found = properties.find(key);
  return found == properties.end() ? std::string_view() : std::string_view(found->second);
}

ServiceType serviceTypeForRole(std::string_view role) {
  const auto* found = std::ranges::find_if(
      kRoles, [&](const RoleService& known) { return equalIgnoringCase(known.role, role); });
  return found == kRoles.end() ? kServiceNonLongFormAudio : found->type;
}

platform::Dictionary makeConfiguration(const Properties& properties) {
  platform::Dictionary configuration{{"audio_framework", "PipeWire"}};
  const auto application = firstText(properties, {"application.id", "pipewire.access.portal.app_id",
                                                  "application.name", "node.name"});
  if (!application.empty()) {
    configuration.set(kApplicationKey, application);
  }
  for (const auto& [name, key] : kTexts) {
    if (const auto text = property(properties, name); !text.empty()) {
      configuration.set(key, cleanText(text));
    }
  }
  for (const auto& [name, key] : kNumbers) {
    if (const auto number = parseNumber(property(properties, name))) {
      configuration.set(key, *number);
    }
  }
  return configuration;
}

std::string nodeName(const Properties& properties, std::uint64_t serial) {
  std::string name = cleanText(property(properties, "node.name"));
  return name.empty() ? "node-" + std::to_string(serial) : name;
}

std::string processName(const Properties& properties) {
  const auto name =
      firstText(properties, {"application.process.binary", "application.name", "node.name"});
  return name.empty() ? "Unknown" : name;
}

}  // namespace halvox::pipewire_reporter
