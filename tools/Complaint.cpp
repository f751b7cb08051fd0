#include "tools/Complaint.h"

#include "tools/JsonText.h"

namespace halvox::tools {

std::string failureJson(std::string_view command, const FailureText& failure) {
  return "{\"command\":" + harmlessJson(quoted(command)) +
         ",\"result\":false,\"error\":{\"kind\":" + quoted(failure.kind) +
         ",\"name\":" + harmlessJson(quoted(failure.name)) +
         ",\"message\":" + harmlessJson(quoted(failure.message)) + "}}";
}

std::string_view failureKind(ExitStatus status) {
  switch (status) {
    case ExitStatus::kDone:
      break;
    case ExitStatus::kRefused:
      return "refused";
    case ExitStatus::kBadArguments:
      return "bad-arguments";
    case ExitStatus::kNoService:
      return "no-service";
    case ExitStatus::kCannotWrite:
      return "cannot-write";
    case ExitStatus::kBadConfiguration:
      return "bad-configuration";
  }
  return "unknown";
}

void Complaint::warn(std::string_view what) const {
  errors_ << "halvoxctl " << command_ << ": " << harmlessText(what) << '\n';
}

ExitStatus Complaint::operator()(ExitStatus status, std::string_view what,
                                 std::string_view kind) const {
  // Both forms begin with the line for people. With --json an object follows: the line goes to
  // standard error, the object to standard output.
  warn(what);
  if (form_ == OutputForm::kJson) {
    const FailureText failure{kind.empty() ? failureKind(status) : kind, "", what};
    out_ << failureJson(command_, failure) << '\n';
  }
  return status;
}

}  // namespace halvox::tools
