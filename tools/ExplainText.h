#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/store/reading/StoreUse.h"
#include "tools/Explanation.h"
#include "tools/MessageFates.h"

// The sentences of `halvoxctl explain`. Pure functions.
namespace halvox::tools {

// Names of a message as they are recorded. The service is empty if it is unknown.
struct MessageName {
  std::string category;
  std::string type;
  std::string service{};
};

// What the texts need to know of the surroundings.
struct ExplainSettings {
  platform::linux_::Configuration configuration;
  platform::linux_::StoreServer server{};
};

// "1 message", "2 messages".
[[nodiscard]] std::string counted(std::uint64_t number, const char* one);
// ", from 2026-11-21 22:44:05.123 to …", for seconds since 1970. Empty without a time.
[[nodiscard]] std::string spanText(std::optional<double> first, std::optional<double> last);

// Whether there can be messages of that category and type.
[[nodiscard]] bool isMessageName(const MessageName& name);

// How messages of this category and type get their names, in sentences.
[[nodiscard]] std::vector<std::string> nameSentences(const MessageName& name);

// The names under which such messages are recorded. Empty if no category has that name.
struct EventNamePair {
  std::string ofAll;
  std::string ofService;  // empty if the service is unknown
};
[[nodiscard]] EventNamePair eventNamesOf(const MessageName& name);

// How one message was compared with the one before, in sentences.
[[nodiscard]] std::vector<std::string> repetitionSentences(const MessageFate& fate);

// What the configuration says.
[[nodiscard]] bool isWanted(const ExplainSettings& settings, const std::string& eventName);
[[nodiscard]] std::string backendName(const ExplainSettings& settings);

// The settings that decide, and what cannot be known, in sentences.
[[nodiscard]] std::vector<Explanation::Setting> settingsThatDecide(const ExplainSettings& settings);
[[nodiscard]] std::vector<std::string> unknownSentences(const ExplainSettings& settings);

}  // namespace halvox::tools
