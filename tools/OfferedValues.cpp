#include "tools/OfferedValues.h"

#include <algorithm>
#include <sstream>
#include <stdexcept>
#include <utility>

#include "client/Vocabulary.h"

namespace halvox::tools {
namespace {

using Kind = OfferedValues::Kind;

// The library has no place for our data at an option, except the name of a validator. One that is
// not active checks nothing, and without a description it is not in the help.
CLI::Option* offer(CLI::Option* option, const OfferedValues& values) {
  std::string text(1, static_cast<char>('0' + static_cast<int>(values.kind)));
  for (const std::string& word : values.words) text += '\n' + word;
  CLI::Validator note;
  note.active(false);
  return option->check(std::move(note), text);
}

std::vector<std::string> namesOf(std::span<const client::NamedNumber> table) {
  std::vector<std::string> names;
  for (const auto& entry : table) names.emplace_back(entry.name);
  return names;
}

// Selects the values of a column in the records of the last day. Older ones would make a person
// wait for a large store. The column has no name, so that its heading is an empty line.
std::vector<std::string> namesOfToday(const std::string& column, const std::string& table) {
  return {"sql", "SELECT DISTINCT " + column + " AS \"\" FROM " + table + " WHERE " + column +
                     " IS NOT NULL AND time > strftime('%s', 'now') - 86400"};
}

}  // namespace

const std::vector<LiveNames>& liveNames() {
  static const std::vector<LiveNames> kNames{
      {"sessions", "--socket", {"list", "--timeout", "1"}},
      {"stored_sessions", "--database", namesOfToday("session_id", "link_messages")},
      {"event_names", "--database", namesOfToday("name", "analytics_events")},
      {"power_event_names", "--database", namesOfToday("event_name", "power_events")},
      {"applications", "--database", namesOfToday("application", "halvox_events")},
  };
  return kNames;
}

CLI::Option* offerFiles(CLI::Option* option, std::vector<std::string> words) {
  return offer(option, {Kind::kFiles, std::move(words)});
}

CLI::Option* offerDirectories(CLI::Option* option) { return offer(option, {Kind::kDirectories}); }

CLI::Option* offerPrograms(CLI::Option* option) { return offer(option, {Kind::kPrograms}); }

CLI::Option* offerWords(CLI::Option* option, std::vector<std::string> words) {
  return offer(option, {Kind::kWords, std::move(words)});
}

CLI::Option* offerLive(CLI::Option* option, const std::string& name) {
  const auto isNamed = [&](const LiveNames& names) { return names.name == name; };
  if (std::ranges::none_of(liveNames(), isNamed)) throw std::logic_error("no live names " + name);
  return offer(option, {Kind::kLive, {name}});
}

CLI::Option* offerCategories(CLI::Option* option) {
  const auto categories = namesOf(client::categories());
  auto words = categories;
  for (const auto& domain : client::domains()) {
    for (const auto& category : categories)
      words.push_back(std::string(domain.name) + "_" + category);
  }
  return offerWords(option, std::move(words));
}

CLI::Option* offerEventTypes(CLI::Option* option) {
  return offerWords(option, namesOf(client::eventTypes()));
}

CLI::Option* offerServiceTypes(CLI::Option* option) {
  return offerWords(option, namesOf(client::serviceTypes()));
}

OfferedValues offeredFor(CLI::Option& option) {
  CLI::Validator* note = nullptr;
  try {
    note = option.get_validator(0);
  } catch (const CLI::OptionNotFound&) {
    return {};
  }
  std::istringstream lines(note->get_name());
  std::string word;
  std::getline(lines, word);
  OfferedValues values{static_cast<Kind>(word.at(0) - '0')};
  while (std::getline(lines, word)) values.words.push_back(word);
  return values;
}

}  // namespace halvox::tools
