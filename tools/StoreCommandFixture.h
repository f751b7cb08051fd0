#pragma once

#include <sstream>
#include <string>

#include "tools/Command.h"
#include "tools/StoredEventsFixture.h"

namespace halvox::tools {

// A fixture for a command that reads a store and prints.
class StoreCommandFixture : public StoredEventsFixture {
 protected:
  // Returns streams for one run of the command. Discards what the run before it printed.
  [[nodiscard]] ToolStreams streams(const std::string& input = "") {
    input_ = std::istringstream(input);
    output_.str("");
    errors_.str("");
    return {input_, output_, errors_};
  }
  // What the last run printed.
  [[nodiscard]] std::string output() const { return output_.str(); }
  [[nodiscard]] std::string errors() const { return errors_.str(); }

  CommonOptions options_;

 private:
  std::istringstream input_;
  std::ostringstream output_;
  std::ostringstream errors_;
};

}  // namespace halvox::tools
