#pragma once

#include <memory>
#include <ostream>
#include <string>

#include "client/HalvoxClient.h"
#include "tools/Command.h"
#include "tools/Requests.h"

namespace halvox::tools {

// Carries requests out over one connection, which it makes at the first of them, and prints their
// answers. Belongs to one thread.
class RequestRunner {
 public:
  // Where to connect to, and where answers and complaints go; `out` and `errors` must outlive it.
  RequestRunner(CommonOptions options, std::ostream& out, std::ostream& errors)
      : options_(std::move(options)), out_(out), errors_(errors) {}

  // `prefix` begins each complaint, before the name of the command: the program, and in a script
  // the file and line.
  ExitStatus run(const Request& request, bool json, const std::string& prefix);

 private:
  class Execution;

  void sayWhatWasPassedOver();

  CommonOptions options_;
  std::ostream& out_;
  std::ostream& errors_;
  std::unique_ptr<client::HalvoxConnection> connection_;
};

}  // namespace halvox::tools
