#include "tools/reference/CommandTree.h"

#include <algorithm>
#include <iterator>
#include <map>
#include <stdexcept>

namespace halvox::tools {
namespace {

DescribedArgument describe(CLI::Option& option) {
  DescribedArgument described;
  for (const auto& name : option.get_snames()) described.names.push_back("-" + name);
  for (const auto& name : option.get_lnames()) described.names.push_back("--" + name);
  described.description = option.get_description();
  described.offered = offeredFor(option);
  described.isRequired = option.get_required();
  described.isHidden = option.get_group().empty();
  const bool isArgument = option.get_positional();
  // The library counts the values of an argument that may be repeated as one very large number.
  const int most = option.get_items_expected_max();
  described.count = most == 0 ? 0 : option.get_type_size();
  described.isValueOptional = most > 0 && option.get_items_expected_min() == 0;
  described.isRepeatable =
      isArgument ? most > 1
                 : option.get_multi_option_policy() == CLI::MultiOptionPolicy::TakeAll &&
                       described.count == 1 && !described.isValueOptional;
  if (described.count == 0) return described;
  described.value = isArgument ? option.get_name(true) : option.get_type_name();
  // The help shows an optional value as "[SECONDS]".
  if (described.value.starts_with('[')) {
    described.value = described.value.substr(1, described.value.size() - 2);
  }
  return described;
}

DescribedCommand describe(CLI::App& app, const std::string& path) {
  DescribedCommand described{.name = app.get_name(),
                             .path = path,
                             .heading = app.get_group(),
                             .summary = app.get_description()};
  const std::string footer = app.get_footer();
  const std::string kExample = "Example:\n";
  const auto example = footer.find(kExample);
  described.details = footer.substr(0, std::min(example, footer.size()));
  while (described.details.ends_with('\n')) described.details.pop_back();
  if (example != std::string::npos) described.example = footer.substr(example + kExample.size());
  for (CLI::Option* option : app.get_options()) {
    auto& list = option->get_positional() ? described.arguments : described.options;
    list.push_back(describe(*option));
  }
  for (CLI::App* below : app.get_subcommands([](const CLI::App*) { return true; })) {
    described.commands.push_back(
        describe(*below, path + (path.empty() ? "" : " ") + below->get_name()));
  }
  described.needsCommand = app.get_require_subcommand_min() > 0;
  return described;
}

void checkCounts(const DescribedCommand& program) {
  std::map<std::string, int> counts;
  for (const DescribedCommand* command : allCommandsOf(program)) {
    for (const auto& option : command->options) {
      for (const auto& name : option.names) {
        if (counts.emplace(name, option.count).first->second != option.count) {
          throw std::logic_error(command->path + " " + name +
                                 ": takes another number of values in another command");
        }
      }
    }
  }
}

}  // namespace

DescribedCommand describeCommands(CLI::App& program) {
  auto described = describe(program, "");
  checkCounts(described);
  return described;
}

std::vector<const DescribedCommand*> allCommandsOf(const DescribedCommand& command) {
  std::vector<const DescribedCommand*> all{&command};
  for (const auto& below : command.commands) {
    std::ranges::copy(allCommandsOf(below), std::back_inserter(all));
  }
  return all;
}

std::string briefly(const std::string& description) {
  std::size_t end = description.size();
  for (const char* stop : {"; ", ". ", ": ", " (default"}) {
    end = std::min(end, description.find(stop));
  }
  return description.substr(0, end);
}

}  // namespace halvox::tools
