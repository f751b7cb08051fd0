#pragma once

namespace halvox::platform::linux_ {

// The first digits of the git commit that this program was built from; empty if the build did not
// know it. The source is made at build time by cmake/WriteCommit.cmake. Only programs link it:
// everything that links it is linked again after each commit.
[[nodiscard]] const char* halvoxCommit();

}  // namespace halvox::platform::linux_
