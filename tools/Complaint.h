#pragma once

#include <ostream>
#include <string>
#include <utility>

#include "tools/Command.h"
#include "tools/JsonText.h"

namespace halvox::tools {

// Says what is wrong, in the name of a command, and gives the exit status. What stands in files and
// arguments cannot drive a terminal.
class Complaint {
 public:
  // `errors` must outlive it.
  Complaint(std::string command, std::ostream& errors)
      : command_(std::move(command)), errors_(errors) {}

  ExitStatus operator()(ExitStatus status, const std::string& what) const {
    errors_ << "halvoxctl " << command_ << ": " << harmlessText(what) << '\n';
    return status;
  }

 private:
  std::string command_;
  std::ostream& errors_;
};

}  // namespace halvox::tools
