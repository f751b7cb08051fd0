#include <memory>

#include "tools/Notify.h"
#include "tools/Preferences.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {
namespace {

using Action = Preferences::Action;

platform::linux_::Result<Action> parseAction(std::string_view text) {
  if (text == "get") return Action::kGet;
  if (text == "set") return Action::kSet;
  if (text == "unset") return Action::kUnset;
  return platform::linux_::Failure<>{"\"" + std::string(text) +
                                     "\" is not known; expected get, set or unset"};
}

Preferences checked(const Preferences& request) {
  if (request.action != Action::kGet && !request.key.has_value()) {
    throw CLI::ValidationError("KEY", "is missing; expected the key to change");
  }
  // Checked here and not by the parser, which knows one form of arguments for all three actions.
  if ((request.action == Action::kSet) != request.value.has_value()) {
    throw CLI::ValidationError("VALUE", request.value.has_value()
                                            ? "is only for set"
                                            : "is missing; expected the new value of the key");
  }
  return request;
}

void addPreferences(CommandSet& commands) {
  const auto request = std::make_shared<Preferences>();
  CLI::App& preferences = commands.add(
      {.name = "preferences",
       .summary = "Show or change settings that the service follows while it runs",
       .example = "halvoxctl preferences set com.tarno.halvox device_name Kitchen",
       .details = "set and unset leave everything else in the file as it is, including comments. "
                  "They cannot change tables with lines of their own; edit the file for that.\nPut "
                  "-- before a VALUE that begins with -.",
       .reach = CommandReach::kFiles});
  offerWords(addParsed(preferences, "ACTION", request->action, parseAction, "get, set or unset")
                 ->required(),
             {"get", "set", "unset"});
  offerWords(
      preferences.add_option("DOMAIN", request->domain, "A domain, such as com.tarno.halvox")
          ->required(),
      {"com.tarno.halvox", "com.tarno.pavisk"});
  offerWords(preferences.add_option("KEY", request->key, "A key; without one, get shows all keys"),
             {"device_name", "disable_reporting", "spatial-audio-accessory-feature"});
  preferences.add_option("VALUE", request->value,
                         "A TOML value; anything else is taken as a string");
  preferences.add_flag("--string", request->isString, "Always take VALUE as a string");
  preferences.add_option("--user", request->user, "Whose settings (default: mobile)")
      ->type_name("USER");
  offerDirectories(
      preferences
          .add_option("--directory", request->directory,
                      "Where the preferences are (default: as the service's configuration says)")
          ->type_name("DIRECTORY"));
  commands.onRun(
      preferences, [request] { return checked(*request); },
      [](const Preferences& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showOrChangePreferences(asked, options.json, streams.output, streams.errors);
      });
}

void addNotify(CommandSet& commands) {
  const auto request = std::make_shared<PostNotification>();
  CLI::App& notify = commands.add({.name = "notify",
                                   .summary = "Post a notification to the service",
                                   .example = "halvoxctl notify com.tarno.halvox.reporting",
                                   .reach = CommandReach::kFiles});
  offerWords(
      notify
          .add_option("NAME", request->name,
                      "The notification: com.tarno.halvox.reporting or "
                      "com.tarno.pavisk.spatial-audio-accessory-feature.changed")
          ->required(),
      {"com.tarno.halvox.reporting", "com.tarno.pavisk.spatial-audio-accessory-feature.changed"});
  offerDirectories(
      notify
          .add_option(
              "--directory", request->directory,
              "Where the service looks for notifications (default: as its configuration says)")
          ->type_name("DIRECTORY"));
  commands.onRun(
      notify, [request] { return *request; },
      [](const PostNotification& asked, const CommonOptions& options, const ToolStreams& streams) {
        return postNotification(asked, options.form(), streams.output, streams.errors);
      });
}

}  // namespace

void addSettingsCommands(CommandSet& commands) {
  addPreferences(commands);
  addNotify(commands);
}

}  // namespace halvox::tools
