#include "tools/reference/CommandTree.h"

#include <algorithm>
#include <map>
#include <sstream>
#include <stdexcept>

#include <gtest/gtest.h>

#include "tools/CommandLine.h"

namespace halvox::tools {
namespace {

using Kind = OfferedValues::Kind;
using Words = std::vector<std::string>;

Words wordsOf(const std::string& text) {
  std::istringstream stream(text);
  Words words;
  for (std::string word; stream >> word;) words.push_back(word);
  return words;
}

const DescribedArgument& find(const std::vector<DescribedArgument>& options,
                              const std::string& name) {
  const auto found = std::ranges::find_if(options, [&](const DescribedArgument& option) {
    return option.value == name || std::ranges::count(option.names, name) == 1;
  });
  if (found == options.end()) throw std::logic_error("no " + name);
  return *found;
}

DescribedCommand commandAt(const std::string& path) {
  const auto program = describeCommandLine();
  for (const DescribedCommand* command : allCommandsOf(program)) {
    if (command->path == path) return *command;
  }
  throw std::logic_error("no " + path);
}

TEST(CommandTreeTest, HasEveryCommandWithItsHelp) {
  const auto program = describeCommandLine();
  const auto all = allCommandsOf(program);

  EXPECT_GT(all.size(), 35U);
  for (const DescribedCommand* command : all) {
    if (command->path.empty()) continue;
    EXPECT_FALSE(command->summary.empty()) << command->path;
    EXPECT_NE(command->example.find(command->name), std::string::npos) << command->path;
    EXPECT_EQ(command->details.find("Example:"), std::string::npos) << command->path;
  }
  EXPECT_TRUE(commandAt("trace").needsCommand);
  EXPECT_FALSE(commandAt("snapshots").needsCommand);
}

TEST(CommandTreeTest, ArgumentsHaveTheirValues) {
  const auto events = commandAt("events").options;
  EXPECT_EQ(find(events, "--last").names, (Words{"-n", "--last"}));
  EXPECT_EQ(find(events, "--last").value, "N");
  EXPECT_EQ(find(events, "--last").count, 1);
  EXPECT_FALSE(find(events, "--last").isRepeatable);
  EXPECT_TRUE(find(events, "--app").isRepeatable);
  EXPECT_EQ(find(events, "--utc").count, 0);
  EXPECT_TRUE(find(events, "--socket").isHidden);
  EXPECT_EQ(find(commandAt("start").options, "--wait").value, "SECONDS");
  EXPECT_TRUE(find(commandAt("start").options, "--wait").isValueOptional);
  EXPECT_EQ(find(commandAt("report").options, "--compare").count, 2);
  EXPECT_TRUE(find(commandAt("summary").arguments, "FILE").isRepeatable);
  EXPECT_FALSE(find(commandAt("run").arguments, "FILE").isRepeatable);
  EXPECT_TRUE(find(commandAt("run").arguments, "FILE").isRequired);
}

// A new option is easily added without saying what to offer for it.
TEST(CommandTreeTest, FilesAndNamesAreOfferedWhereTheyAreExpected) {
  const std::map<std::string, Kind> kinds{
      {"FILE", Kind::kFiles},     {"PATH", Kind::kFiles}, {"DIRECTORY", Kind::kDirectories},
      {"CATEGORY", Kind::kWords}, {"TYPE", Kind::kWords}, {"FORMAT", Kind::kWords},
      {"KIND", Kind::kWords},     {"KEY", Kind::kWords},  {"TIME", Kind::kWords}};
  int seen = 0;
  const auto program = describeCommandLine();
  for (const DescribedCommand* command : allCommandsOf(program)) {
    auto all = command->options;
    all.insert(all.end(), command->arguments.begin(), command->arguments.end());
    for (const auto& option : all) {
      const auto expected = kinds.find(option.value);
      if (expected == kinds.end()) continue;
      EXPECT_EQ(option.offered.kind, expected->second) << command->path << " " << option.value;
      ++seen;
    }
  }
  EXPECT_GT(seen, 50);
}

TEST(CommandTreeTest, CommandsAcceptTheWordsThatAreOffered) {
  const auto program = describeCommandLine();
  int tried = 0;
  for (const DescribedCommand* command : allCommandsOf(program)) {
    for (const auto& option : command->options) {
      if (option.offered.kind != Kind::kWords) continue;
      for (const std::string& word : option.offered.words) {
        Words line = wordsOf(command->path);
        line.insert(line.end(), {option.names.back(), word});
        std::istringstream noInput;
        const auto parsed = parseCommandLine(line, CommandSource::kArguments, noInput);
        const auto* error = std::get_if<CommandLineText>(&parsed);
        // Other arguments may be missing.
        if (error != nullptr) {
          EXPECT_FALSE(error->reason.starts_with(option.names.back()) &&
                       error->reason.find(word) != std::string::npos)
              << error->text;
        }
        ++tried;
      }
    }
  }
  EXPECT_GT(tried, 300);
}

TEST(CommandTreeTest, AnOptionTakesAsManyValuesInEveryCommand) {
  CLI::App app;
  std::string text;
  bool flag = false;
  app.add_subcommand("a")->add_option("--all", text);
  app.add_subcommand("b")->add_flag("--all", flag);

  EXPECT_THROW(describeCommands(app), std::logic_error);
}

TEST(CommandTreeTest, ABriefDescriptionIsTheFirstPartOfTheWhole) {
  EXPECT_EQ(briefly("Only the newest N; 0 with --follow shows new ones only"), "Only the newest N");
  EXPECT_EQ(briefly("How long (default: 5)"), "How long");
  EXPECT_EQ(briefly("Newest first"), "Newest first");
}

}  // namespace
}  // namespace halvox::tools
