#pragma once

#include <any>
#include <chrono>
#include <cstdint>
#include <functional>
#include <istream>
#include <ostream>
#include <string>
#include <utility>

// What all commands of halvoxctl have in common: their options, streams and exit statuses.
namespace halvox::tools {

// The exit status of halvoxctl. The manual page documents these for users.
enum class ExitStatus : int {
  kDone = 0,
  kRefused = 1,            // the service refused, or what was asked for does not exist
  kBadArguments = 2,       // wrong arguments, or a named file that cannot be used
  kNoService = 69,         // EX_UNAVAILABLE: no service, no answer, connection lost, or no store
  kCannotWrite = 74,       // EX_IOERR: standard output or a file cannot be written or changed
  kBadConfiguration = 78,  // EX_CONFIG: the configuration file is wrong
};

enum class OutputForm : std::uint8_t { kText, kJson };

// The options that every command takes.
struct CommonOptions {
  bool json = false;
  std::string socket;  // empty: the usual places
  std::chrono::milliseconds timeout{5000};

  [[nodiscard]] OutputForm form() const { return json ? OutputForm::kJson : OutputForm::kText; }
};

// The streams of one run. Does not own them.
struct ToolStreams {
  std::istream& input;
  std::ostream& output;
  std::ostream& errors;
  int outputDescriptor = -1;  // the descriptor of `output`; -1 if it has none
  bool isInputTerminal = false;
  bool isErrorTerminal = false;
};

// A parsed command line: the request, in the type of its command, and the function that carries it
// out.
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

  // Returns null if the request is of another type.
  template <typename Asked>
  [[nodiscard]] const Asked* asked() const {
    return std::any_cast<Asked>(&asked_);
  }

  // Carries the request out. Blocks until it is done, or for --follow and --watch until the output
  // is closed.
  ExitStatus run(const ToolStreams& streams) const { return run_(*this, streams); }

  CommonOptions options{};

 private:
  std::any asked_;
  std::function<ExitStatus(const Command&, const ToolStreams&)> run_;
};

}  // namespace halvox::tools
