#pragma once

#include <string>
#include <vector>

// The packets of a trace as lines, for the tests of what makes them.
namespace halvox::tools {

// One line for each packet, with tracks by their numbers without the kind:
//
//   process 2 org.player
//   track 8 of 2: playback 8
//   counter 8 of 8: volume
//   8 begin 1000.5 name {a=1 b=x}
//   8 end 1001 | 8 instant 1001 name | 8 count 1001 0.5
[[nodiscard]] std::vector<std::string> packetLines(const std::string& trace);

}  // namespace halvox::tools
