#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace halvox::tools {

// The answer of `halvoxctl explain`: where messages went and why. Plain values. Texts may come from
// clients; printing escapes what could control a terminal.
struct Explanation {
  // What a sink took of the messages in question. A sink is a consumer of messages: the events, the
  // link, the power log and so on.
  struct Sink {
    // kUnknown: the store does not show it, whatever the sink did.
    enum class Took : std::uint8_t { kYes, kNo, kUnknown };
    std::string name;
    Took took = Took::kUnknown;
    std::optional<std::uint64_t> messages{};  // how many it took; empty if that is not counted
    std::int64_t record = 0;                  // the newest message's record there; 0: none
    std::string why{};                        // sentences
  };
  // A setting that decides, and what it does.
  struct Setting {
    std::string key;
    std::string value;
    std::string effect;  // a sentence
  };

  std::string kind;                     // "event", "record" or "session"
  std::string subject;                  // what is explained
  std::vector<std::string> name{};      // sentences: how it got its name
  std::vector<std::string> sessions{};  // sentences: sessions and repetitions
  std::vector<Sink> sinks{};
  std::vector<Setting> settings{};
  std::vector<std::string> unknown{};  // sentences: what nobody can say from here
};

// Breaks a text at blanks into lines of at most that many columns, unless a word is longer. Each
// line begins with `indent` blanks and has a line end.
[[nodiscard]] std::string wrapped(const std::string& text, std::size_t width, std::size_t indent);

// Prints sections with sentences and aligned columns. `width` is that of the terminal, if there is
// one.
void printExplanation(const Explanation& explanation, std::ostream& out,
                      std::optional<std::size_t> width);
// A JSON object on one line, without a line end.
[[nodiscard]] std::string explanationJson(const Explanation& explanation);

}  // namespace halvox::tools
