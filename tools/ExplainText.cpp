#include "tools/ExplainText.h"

#include <array>
#include <cstdint>
#include <cstdio>
#include <optional>

#include "backends/HVReportingEventNames.h"
#include "backends/HVReportingUtility.h"
#include "client/Vocabulary.h"
#include "platform/linux/configuration/LinkBackendName.h"
#include "platform/linux/store/EventNames.h"
#include "tools/ServiceConfiguration.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoreUse;

std::string hexadecimal(std::uint32_t number) {
  std::array<char, 16> text{};
  std::snprintf(text.data(), text.size(), "0x%08x", number);
  return text.data();
}

// The number of a category's text, also of one that the vocabulary does not list, such as
// "Session_Undefined" or "_Record". Nothing if no number has that text.
std::optional<AudioEventCategory> categoryNumber(const std::string& text) {
  constexpr client::Category kUnlistedDomain = 0x00010000;
  const auto isText = [&](client::Category number) {
    return HVReportingUtilityCategoryString(static_cast<AudioEventCategory>(number)) == text;
  };
  std::vector<client::Category> domains{0, kUnlistedDomain};
  for (const auto& domain : client::domains()) domains.push_back(domain.number);
  for (const client::Category domain : domains) {
    if (isText(domain)) return static_cast<AudioEventCategory>(domain);
    for (const auto& category : client::categories()) {
      if (isText(domain | category.number)) {
        return static_cast<AudioEventCategory>(domain | category.number);
      }
    }
  }
  return std::nullopt;
}

bool isListed(const std::string& category) { return client::findCategory(category).has_value(); }

AudioServiceType serviceNumber(const std::string& service) {
  return HVReportingUtilityGenerateServiceTypeFromServiceName(service);
}

}  // namespace

std::string counted(std::uint64_t number, const char* one) {
  return std::to_string(number) + " " + one + (number == 1 ? "" : "s");
}

std::string spanText(std::optional<double> first, std::optional<double> last) {
  if (!first || !last) return {};
  return ", from " + localTime(*first) + " to " + localTime(*last);
}

bool isMessageName(const MessageName& name) {
  return categoryNumber(name.category).has_value() &&
         HVReportingUtilityTypeString(MessageFates::typeOf(name.type)) == name.type;
}

EventNamePair eventNamesOf(const MessageName& name) {
  const auto category = categoryNumber(name.category);
  if (!category) return {};
  const HVReportingEventNames names(*category, MessageFates::typeOf(name.type),
                                    serviceNumber(name.service));
  return {std::string(names.ofAll.text()),
          name.service.empty() ? std::string() : std::string(names.ofService.text())};
}

std::vector<std::string> nameSentences(const MessageName& name) {
  std::vector<std::string> sentences;
  const auto category = categoryNumber(name.category);
  if (!category) return {"No category has the name " + name.category + "."};
  if (isListed(name.category)) {
    sentences.push_back("The category is " + name.category + " (" +
                        hexadecimal(static_cast<std::uint32_t>(*category)) + ").");
  } else {
    sentences.push_back(
        "The category " + name.category +
        " stands for several numbers: \"Undefined\" for each low half that is not a "
        "category, \"_\" for each high half that is not exactly one domain.");
  }
  if (const auto type = client::findEventType(name.type)) {
    sentences.push_back("The type is " + name.type + " (" + std::to_string(*type) + ").");
  } else {
    sentences.push_back("The type " + name.type + " stands for every number without a name.");
  }
  const EventNamePair names = eventNamesOf(name);
  sentences.push_back("Every message of this category and type has the name " + names.ofAll + ".");
  if (name.service.empty()) {
    sentences.push_back(
        "It has a second name with the service type of its session in the place of "
        "\"halvox\".");
  } else {
    sentences.push_back("If its session has the service type " + name.service + " (" +
                        std::to_string(static_cast<std::uint16_t>(serviceNumber(name.service))) +
                        "), it has the second name " + names.ofService + ".");
  }
  return sentences;
}

bool isWanted(const ExplainSettings& settings, const std::string& eventName) {
  return platform::linux_::EventNames(settings.configuration.analytics.wanted).matches(eventName);
}

std::string backendName(const ExplainSettings& settings) {
  return platform::linux_::linkBackendName(settings.configuration.link.backend);
}

std::vector<std::string> repetitionSentences(const MessageFate& fate) {
  std::vector<std::string> sentences;
  if (fate.session && *fate.session != -1) {
    sentences.push_back("Session " + std::to_string(*fate.session) +
                        (fate.link == LinkFate::kSession ? " recorded it." : " dropped it."));
  } else if (fate.link == LinkFate::kRepeats) {
    sentences.emplace_back(
        "Several sessions recorded an equal message. The store does not show which of them dropped "
        "this one.");
  }
  if (fate.isExempt) {
    sentences.emplace_back(
        "Errors are never dropped as repetitions, however often they repeat: category Error "
        "without a "
        "domain, and type Error.");
  } else if (fate.link == LinkFate::kRepeats || fate.link == LinkFate::kEqualsEvent) {
    sentences.push_back(
        "It equals record " + std::to_string(fate.previous) +
        ", the message of the same category, type, application and service type "
        "before it, apart from hvreporting_timestamp, systemuptime_sec and "
        "processuptime_ms. Sessions drop such a message, however long ago the other "
        "one came. Its events are recorded all the same.");
  } else if (fate.link == LinkFate::kMayRepeat) {
    sentences.push_back(
        "It equals record " + std::to_string(fate.previous) +
        ", which a session recorded. That session dropped it as a repetition, unless "
        "another session, which has no link, sent it.");
  } else if (fate.equalsPrevious) {
    sentences.push_back("It equals record " + std::to_string(fate.previous) +
                        ", the message of the same category, type, application and service type "
                        "before it, but the session did not drop it. The store does not show why: "
                        "a message between the two may be missing, or the session began again and "
                        "has no summary of its run before, for example because the service was "
                        "killed.");
  } else if (fate.previous != 0) {
    sentences.push_back("It differs from record " + std::to_string(fate.previous) +
                        ", the message of the same category, type, application and service type "
                        "before it. It is not a repetition.");
  } else if (fate.message.isEvent) {
    sentences.emplace_back(
        "The store has no earlier message of the same category, type, application and service type "
        "with which it could be compared.");
  } else {
    sentences.emplace_back(
        "It has no event: the service made it and sends it only through the link, or events of its "
        "names are not wanted.");
  }
  return sentences;
}

std::vector<Explanation::Setting> settingsThatDecide(const ExplainSettings& settings) {
  const auto& configuration = settings.configuration;
  std::string wanted;
  for (const std::string& pattern : configuration.analytics.wanted) {
    wanted += (wanted.empty() ? "" : " ") + pattern;
  }
  const auto onOff = [](bool isOn) { return std::string(isOn ? "true" : "false"); };
  return {{"analytics.wanted", wanted.empty() ? "(none)" : wanted,
           "analytics.wanted: only events whose name matches a pattern are recorded."},
          {"link.backend", backendName(settings),
           "link.backend: only \"local\" stores link messages here."},
          {"storage.retention_days", std::to_string(configuration.storage.retentionDays),
           "storage: older records are deleted, the oldest ones also above max_megabytes."},
          {"storage.max_megabytes", std::to_string(configuration.storage.maxMegabytes), ""},
          {"device.InternalBuild", onOff(isInternalBuild(settings.configuration)),
           "device.InternalBuild: only internal builds write summary files and captures."},
          {"features.Acoustat.Tracing", onOff(isTracingOn(settings.configuration)),
           "features.Acoustat.Tracing: without it, no session is traced."}};
}

std::vector<std::string> unknownSentences(const ExplainSettings& settings) {
  std::vector<std::string> sentences{
      "The settings are those of the configuration file now. The service reads it once, at its "
      "start, "
      "and may have stored these records with others.",
      "A message that was refused, or that found no session, leaves no record. The service counts "
      "what it refuses, drops and suppresses, by reason, for all messages together; `halvoxctl sql "
      "'SELECT * FROM losses'` shows these counts."};
  switch (settings.server.use) {
    case StoreUse::kServed:
      sentences.emplace_back(
          "A service has this store open. Messages of the last half second may not be in it yet, "
          "and "
          "single messages wait for one second.");
      break;
    case StoreUse::kNotServed:
      sentences.emplace_back("No service has this store open.");
      break;
    case StoreUse::kUnknown:
      sentences.emplace_back("It is not known whether a service has this store open.");
      break;
  }
  return sentences;
}

}  // namespace halvox::tools
