#pragma once

#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The longest token made from a client's text, in bytes. It is bounded because the server closes
// the connection, which all sessions share, if a line of the NATS protocol is too long (over 4,096
// bytes by default).
inline constexpr std::size_t kLongestSubjectToken = 128;

// Makes one token of a subject from a text that a client may have chosen. A client must not be able
// to publish on another subject or to break the protocol. Therefore "_" replaces "." (begins
// another token), "*" and ">" (wildcards), blanks, tabs and line ends (end the subject), and all
// other control characters. Cuts the text at kLongestSubjectToken, between characters. An empty
// text becomes "_".
std::string subjectToken(std::string_view text);

}  // namespace halvox::platform::linux_
