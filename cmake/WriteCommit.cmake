# cmake -DSOURCE=<source tree> -DOUTPUT=<file> -P WriteCommit.cmake
#
# Writes the C++ source that holds the commit of the source tree. Leaves an unchanged file alone, so that
# nothing is compiled again. The commit is the one in the file COMMIT, which scripts/package makes because
# it builds outside git, otherwise that of git. A source archive has neither; its commit is empty.
set(commit "")
if(EXISTS ${SOURCE}/COMMIT)
  file(STRINGS ${SOURCE}/COMMIT commit LIMIT_COUNT 1)
elseif(EXISTS ${SOURCE}/.git)
  # Without the test above, git would answer for a tree inside another repository. The fixed length
  # gives every clone the same text.
  find_program(GIT git)
  if(GIT)
    execute_process(COMMAND ${GIT} -C ${SOURCE} rev-parse --verify --short=12 HEAD
      OUTPUT_VARIABLE commit OUTPUT_STRIP_TRAILING_WHITESPACE ERROR_QUIET)
  endif()
endif()
if(NOT commit MATCHES "^[0-9a-f]+$")
  set(commit "")
endif()
file(CONFIGURE OUTPUT ${OUTPUT} @ONLY CONTENT [[
#include "platform/linux/version/Commit.h"

namespace halvox::platform::linux_ {

const char* halvoxCommit() { return "@commit@"; }

}  // namespace halvox::platform::linux_
]])
