#pragma once

#include <string>
#include <string_view>
#include <vector>

// Where programs look for the service and for its store, by one rule: the place that was named, and
// no other; else the user's when something is there, else the system's.
namespace halvox::client {

// Where the service's sockets are looked for, in this order. `named`, when it is not empty, is the
// only one; else $HALVOX_SOCKET is; else there are the user's, in $XDG_RUNTIME_DIR, which counts
// when it is an absolute path, and the system's. Never empty.
std::vector<std::string> socketPlaces(std::string_view named = {});

// A place that was tried without success, and the system's error there.
struct TriedPlace {
  std::string path;
  int error = 0;
};

// Whether this error says that nothing is at a place, so that the next one is tried: there is no
// such file, or it is a socket that nobody serves. Any other error is about something that is
// there.
bool meansAbsence(int error);

// "no service found; tried A (No such file or directory), then B (Connection refused)", or for a
// single place "no service at A: …". `what` is what was looked for; `tried` is not empty.
std::string describeTried(std::string_view what, const std::vector<TriedPlace>& tried);

}  // namespace halvox::client
