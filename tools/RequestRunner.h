#pragma once

#include <memory>
#include <ostream>
#include <string>

#include "client/HalvoxClient.h"
#include "tools/Command.h"
#include "tools/Requests.h"

namespace halvox::tools {

// Carries out requests over one connection and prints the answers. Connects at the first request.
// Belongs to one thread. A request that fails prints the reason and returns its exit status.
class RequestRunner {
 public:
  // Prints answers to `out` and failures to `errors`, which must outlive it.
  RequestRunner(CommonOptions options, std::ostream& out, std::ostream& errors)
      : options_(std::move(options)), out_(out), errors_(errors) {}

  // `prefix` stands before the name of the command in error messages: the program, or the file and
  // line of a script.
  ExitStatus run(const Request& request, bool json, const std::string& prefix);

 private:
  class Execution;

  void warnOfUnservedSockets();

  CommonOptions options_;
  std::ostream& out_;
  std::ostream& errors_;
  std::unique_ptr<client::HalvoxConnection> connection_;
};

}  // namespace halvox::tools
