#pragma once

#include <any>
#include <chrono>
#include <cstdint>
#include <functional>
#include <istream>
#include <ostream>
#include <string>
#include <utility>

// What every command of halvoxctl has: how it is run, with what, and how it ends.
namespace halvox::tools {

// How a run of halvoxctl ends; documented in its manual page.
enum class ExitStatus : int {
  kDone = 0,
  kRefused = 1,       // the service said no
  kBadArguments = 2,  //
  kNoService = 69,    // EX_UNAVAILABLE: nobody answers, the connection was lost, there is no store
  kCannotWrite = 74,  // EX_IOERR: standard output takes nothing, a file cannot be read or changed
  kBadConfiguration = 78,  // EX_CONFIG
};

enum class OutputForm : std::uint8_t { kText, kJson };

// What all commands take.
struct CommonOptions {
  bool json = false;
  std::string socket;  // empty: the client's default
  std::chrono::milliseconds timeout{5000};

  [[nodiscard]] OutputForm form() const { return json ? OutputForm::kJson : OutputForm::kText; }
};

// What a program has to read from and write to.
struct ToolStreams {
  std::istream& input;
  std::ostream& output;
  std::ostream& errors;
  int outputDescriptor = -1;  // what `output` writes to
  bool isInputTerminal = false;
};

// A command line that was understood: what it asks for, in the type of its command, and the
// function that carries it out.
class Command {
 public:
  template <typename Asked>
  using Run = ExitStatus (*)(const Asked& asked, const CommonOptions& options,
                             const ToolStreams& streams);

  template <typename Asked>
  Command(Asked request, Run<Asked> carryOut)
      : asked_(std::move(request)),
        run_([carryOut](const Command& command, const ToolStreams& streams) {
          return carryOut(*command.asked<Asked>(), command.options, streams);
        }) {}

  // Null when the command asks for something else.
  template <typename Asked>
  [[nodiscard]] const Asked* asked() const {
    return std::any_cast<Asked>(&asked_);
  }

  ExitStatus run(const ToolStreams& streams) const { return run_(*this, streams); }

  CommonOptions options{};

 private:
  std::any asked_;
  std::function<ExitStatus(const Command&, const ToolStreams&)> run_;
};

}  // namespace halvox::tools
