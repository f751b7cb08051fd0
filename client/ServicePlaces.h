#pragma once

#include <string>
#include <string_view>
#include <vector>

// Where programs look for the service and its store. The rule is the same for all: only the place
// that was named, if any; otherwise the user's place if something is there; otherwise the system's.
namespace halvox::client {

// Returns the paths of the service's socket to try, in order; never an empty list. If `named` is
// not empty, it is the only one. Otherwise, if $HALVOX_SOCKET is set, that is the only one.
// Otherwise the list has the user's socket, if $XDG_RUNTIME_DIR is an absolute path, then the
// system's.
std::vector<std::string> socketPlaces(std::string_view named = {});

// A place that was tried without success, with the errno of the attempt.
struct TriedPlace {
  std::string path;
  int error = 0;
};

// Returns true if the errno means that nothing is at a place and the next one is to be tried: the
// file does not exist, or no process listens on the socket. Any other error concerns something that
// exists.
bool meansAbsence(int error);

// Returns "no service found; tried A (No such file or directory), then B (Connection refused)", or
// for a single place "no service at A: …". `what` names what was looked for; `tried` must not be
// empty.
std::string describeTried(std::string_view what, const std::vector<TriedPlace>& tried);

}  // namespace halvox::client
