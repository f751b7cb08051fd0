#pragma once

#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The longest token that is made of a client's text, in bytes. A server ends the connection of
// everybody when one line of the protocol is longer than it takes (4,096 bytes by default).
inline constexpr std::size_t kLongestSubjectToken = 128;

// One token of a subject, made of a text that a client may have chosen, so that whoever chooses it
// can neither publish to another subject nor break the protocol. Replaced by "_" are: ".", which
// would begin another token; "*" and ">", the wildcards; blanks, tabs and line ends, which would
// end the subject; and all other control characters. What is longer than kLongestSubjectToken is
// cut off between characters, and an empty text becomes "_".
std::string subjectToken(std::string_view text);

}  // namespace halvox::platform::linux_
