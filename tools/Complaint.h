#pragma once

#include <ostream>
#include <string>
#include <string_view>
#include <utility>

#include "tools/Command.h"

namespace halvox::tools {

// Why a command failed, in the form of its JSON output.
struct FailureText {
  std::string_view kind;     // one word for programs; the manual page lists them
  std::string_view name;     // the name of the service's error; empty for other failures
  std::string_view message;  // for a person
};

// Returns {"command":…,"result":false,"error":{"kind":…,"name":…,"message":…}} on one line, without
// a line end. Characters that could control a terminal are escaped.
std::string failureJson(std::string_view command, const FailureText& failure);

// Returns the kind of a failure for which only the exit status is known.
std::string_view failureKind(ExitStatus status);

// Reports the failure of one command: one line on `errors`, and with JSON output also an object on
// `out`. Escapes characters that could control a terminal, because messages quote files and
// arguments. Belongs to one thread.
class Complaint {
 public:
  // The streams must outlive it.
  Complaint(std::string command, OutputForm form, std::ostream& out, std::ostream& errors)
      : command_(std::move(command)), form_(form), out_(out), errors_(errors) {}

  // Reports a failure and returns `status`. `kind` is the kind in JSON; if it is empty,
  // failureKind(status) is used.
  ExitStatus operator()(ExitStatus status, std::string_view what, std::string_view kind = {}) const;
  // Reports a problem that does not end the command: only a line on `errors`. An object on `out`
  // would mean that the command failed.
  void warn(std::string_view what) const;

 private:
  std::string command_;
  OutputForm form_;
  std::ostream& out_;
  std::ostream& errors_;
};

}  // namespace halvox::tools
