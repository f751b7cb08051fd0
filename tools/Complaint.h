#pragma once

#include <ostream>
#include <string>
#include <string_view>
#include <utility>

#include "tools/Command.h"

namespace halvox::tools {

// Why a command failed, as its JSON output has it.
struct FailureText {
  std::string_view kind;     // one word for programs; the manual page lists them
  std::string_view name;     // of the service's error; empty when it is not one of the service
  std::string_view message;  // for a person
};

// {"command":…,"result":false,"error":{"kind":…,"name":…,"message":…}} on one line, without its
// end. Text from outside cannot drive a terminal.
std::string failureJson(std::string_view command, const FailureText& failure);

// The kind of a failure of which nothing but the exit status is known.
std::string_view failureKind(ExitStatus status);

// Says what is wrong, in the name of a command, and gives the exit status: a line on `errors`, and
// where the output is JSON an object on `out` too. What stands in files and arguments cannot drive
// a terminal.
class Complaint {
 public:
  // The streams must outlive it.
  Complaint(std::string command, OutputForm form, std::ostream& out, std::ostream& errors)
      : command_(std::move(command)), form_(form), out_(out), errors_(errors) {}

  // `kind` is the failure's in JSON; empty: the one that belongs to the status.
  ExitStatus operator()(ExitStatus status, std::string_view what, std::string_view kind = {}) const;
  // Says what is wrong though the command goes on: a line on `errors`, and nothing on `out`, where
  // an object would mean that the command failed.
  void warn(std::string_view what) const;

 private:
  std::string command_;
  OutputForm form_;
  std::ostream& out_;
  std::ostream& errors_;
};

}  // namespace halvox::tools
