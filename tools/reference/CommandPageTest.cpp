#include "tools/reference/CommandPage.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/CommandLine.h"

namespace halvox::tools {
namespace {

using testing::HasSubstr;
using testing::Not;

DescribedArgument option(std::vector<std::string> names, std::string value,
                         std::string description) {
  const int count = value.empty() ? 0 : 1;
  return {.names = std::move(names),
          .value = std::move(value),
          .description = std::move(description),
          .count = count};
}

// A program with one command, `play`, and what all commands accept.
DescribedCommand playing(DescribedCommand play) {
  play.name = "play";
  play.path = "play";
  play.heading = "Sound";
  return {.options = {option({"--json"}, "", "Print JSON")}, .commands = {std::move(play)}};
}

TEST(CommandPageTest, ACommandHasItsHeadingSummaryAndDetails) {
  const auto page = commandsPage(playing({.summary = "Play a file", .details = "Loudly."}));

  EXPECT_THAT(page, HasSubstr("\n# SOUND\n"));
  EXPECT_THAT(page, HasSubstr("\n## play\n\n**halvoxctl play**\n\nPlay a file.\n\nLoudly.\n"));
}

TEST(CommandPageTest, OptionsAndArgumentsAreExplained) {
  auto file = option({}, "FILE", "What to play");
  file.isRequired = file.isRepeatable = true;

  const auto page = commandsPage(playing(
      {.options = {option({"-l", "--loud"}, "N", "How loud")}, .arguments = {std::move(file)}}));

  EXPECT_THAT(page, HasSubstr("**halvoxctl play** \\[*OPTION*\\]... *FILE*...\n"));
  EXPECT_THAT(page, HasSubstr("\n*FILE*\n: What to play.\n"));
  EXPECT_THAT(page, HasSubstr("\n**-l**, **--loud** *N*\n: How loud.\n"));
}

TEST(CommandPageTest, WhatMustBeGivenIsInTheSynopsis) {
  auto to = option({"--to"}, "OUT", "The result");
  to.isRequired = true;

  const auto page =
      commandsPage(playing({.options = {std::move(to)}, .arguments = {option({}, "FILE", "")}}));

  EXPECT_THAT(page, HasSubstr("**halvoxctl play** **--to** *OUT* \\[*FILE*\\]\n"));
}

TEST(CommandPageTest, OptionsOfAllCommandsStandOnce) {
  const auto program = playing({.options = {option({"--json"}, "", "Print JSON")}});

  EXPECT_THAT(commandsPage(program), Not(HasSubstr("--json")));
  EXPECT_THAT(commonOptionsPage(program), HasSubstr("\n**--json**\n: Print JSON.\n"));
}

TEST(CommandPageTest, HiddenOptionsAreNotShown) {
  auto hidden = option({"--socket"}, "PATH", "The socket");
  hidden.isHidden = true;

  EXPECT_THAT(commandsPage(playing({.options = {std::move(hidden)}})), Not(HasSubstr("socket")));
}

TEST(CommandPageTest, MarkupInAHelpTextIsText) {
  const auto page = commandsPage(playing({.summary = "Play 'com.*' or any_file [now]"}));

  EXPECT_THAT(page, HasSubstr("Play 'com.\\*' or any\\_file \\[now\\].\n"));
}

TEST(CommandPageTest, NotesStandBeforeTheExample) {
  const auto page = commandsPage(playing({.example = "  halvoxctl play a.wav\n"}));

  EXPECT_THAT(page, HasSubstr("\n@notes play@\n\nExample:\n\n    halvoxctl play a.wav\n"));
}

TEST(CommandPageTest, EachCommandOfTheProgramHasASection) {
  const auto program = describeCommandLine();
  const auto page = commandsPage(program);

  for (const DescribedCommand* command : allCommandsOf(program)) {
    if (!command->path.empty()) {
      EXPECT_THAT(page, HasSubstr("\n## " + command->path + "\n")) << command->path;
    }
  }
}

}  // namespace
}  // namespace halvox::tools
