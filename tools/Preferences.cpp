#include "tools/Preferences.h"

#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/linux/settings/SettingNames.h"
#include "tools/JsonText.h"
#include "tools/PreferenceEditing.h"
#include "tools/PreferenceWriting.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::Value;
using platform::linux_::Configuration;

std::string shown(const Value& value, bool json) {
  if (!json && value.isString()) return harmlessText(value.string());
  return harmlessJson(toJson(value));
}

ExitStatus nothingThere(const Preferences& request, const Complaint& complain) {
  return complain(ExitStatus::kRefused, platform::linux_::shownName(*request.key) +
                                            " is not set in " +
                                            platform::linux_::shownName(request.domain));
}

ExitStatus get(const Preferences& request, const std::filesystem::path& file, bool json,
               std::ostream& out, const Complaint& complain) {
  const auto content = platform::linux_::readPreferences(file);
  if (!content) return complain(ExitStatus::kCannotWrite, content.error().message);
  const platform::Dictionary& values = *content;
  if (!request.key.has_value()) {
    if (json) {
      out << shown(values, json) << '\n';
    } else {
      for (const auto& [key, value] : values) {
        out << harmlessText(key.text()) << " = " << shown(value, json) << '\n';
      }
    }
    return ExitStatus::kDone;
  }
  const Value* value = values.find(*request.key);
  if (value == nullptr) return nothingThere(request, complain);
  out << shown(*value, json) << '\n';
  return ExitStatus::kDone;
}

ExitStatus change(const std::filesystem::path& file, const PreferenceEdit& edit,
                  const Complaint& complain) {
  const auto changed = changePreferenceFile(file, edit);
  if (!changed) return complain(ExitStatus::kCannotWrite, changed.error().message);
  return ExitStatus::kDone;
}

ExitStatus set(const Preferences& request, const std::filesystem::path& file,
               const Complaint& complain) {
  auto parsed = parsePreferenceValue(
      *request.value, request.isString ? ValueForm::kString : ValueForm::kTomlOrString);
  if (!parsed) return complain(ExitStatus::kBadArguments, parsed.error().message);
  return change(
      file,
      [&](std::string_view text, const std::filesystem::path& named) {
        return withPreference(text, *request.key, *parsed, named);
      },
      complain);
}

ExitStatus unset(const Preferences& request, const std::filesystem::path& file,
                 const Complaint& complain) {
  // Changing a missing file would create its directories, for nothing.
  std::error_code ignored;
  if (!std::filesystem::exists(file, ignored)) return nothingThere(request, complain);
  bool wasThere = true;
  const ExitStatus status = change(
      file,
      [&](std::string_view text, const std::filesystem::path& named) {
        auto edited = withoutPreference(text, *request.key, named);
        // After an error the status is that of the error, not that of a missing key.
        wasThere = !edited || *edited != text;
        return edited;
      },
      complain);
  return wasThere ? status : nothingThere(request, complain);
}

}  // namespace

ExitStatus showOrChangePreferences(const Preferences& request, bool json, std::ostream& out,
                                   std::ostream& errors) {
  const Complaint complain("preferences", json ? OutputForm::kJson : OutputForm::kText, out,
                           errors);
  const auto found =
      settingsDirectory(request.directory, &Configuration::preferencesDirectory, complain);
  if (const auto* status = std::get_if<ExitStatus>(&found)) return *status;
  const auto file = platform::linux_::preferencePath(std::get<std::filesystem::path>(found),
                                                     request.user, request.domain);
  if (!file.has_value()) {
    return complain(ExitStatus::kBadArguments,
                    "user " + platform::linux_::shownName(request.user) + ", domain " +
                        platform::linux_::shownName(request.domain) +
                        ": expected names that a file can have, without \"/\"");
  }
  switch (request.action) {
    case Preferences::Action::kGet:
      return get(request, *file, json, out, complain);
    case Preferences::Action::kSet:
      return set(request, *file, complain);
    case Preferences::Action::kUnset:
      return unset(request, *file, complain);
  }
  return ExitStatus::kBadArguments;
}

}  // namespace halvox::tools
