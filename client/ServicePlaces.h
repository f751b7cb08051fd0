#pragma once

#include <string>
#include <string_view>
#include <vector>

// Where programs look for the service and its store. All programs use the same rule. If a place was
// named, they use only that one. Otherwise they use the user's place if something is there, and
// otherwise the system's place.
namespace halvox::client {

// Returns the paths at which to try the service's socket, in order. The list is never empty. If
// `named` is not empty, it is the only path. Otherwise, if $HALVOX_SOCKET is set, that is the only
// path. Otherwise the list has the user's socket, if $XDG_RUNTIME_DIR is an absolute path, and then
// the system's socket.
std::vector<std::string> socketPlaces(std::string_view named = {});

// A place that was tried without success, with the errno of the attempt.
struct TriedPlace {
  std::string path;
  int error = 0;
};

// Returns true if the errno means that nothing is at a place: the file does not exist, or no
// process listens on the socket. The next place is tried then. Any other error concerns something
// that exists.
bool meansAbsence(int error);

// Returns "no service found; tried A (No such file or directory), then B (Connection refused)", or
// for a single place "no service at A: …". `what` names what was looked for; `tried` must not be
// empty.
std::string describeTried(std::string_view what, const std::vector<TriedPlace>& tried);

}  // namespace halvox::client
