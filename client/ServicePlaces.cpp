#include "client/ServicePlaces.h"

#include <cerrno>
#include <cstdlib>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::client {
namespace {

constexpr std::string_view kBelowRuntimeDirectory = "/halvox/reporting.sock";

std::string variable(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr ? value : "";
}

}  // namespace

std::vector<std::string> socketPlaces(std::string_view named) {
  if (!named.empty()) return {std::string(named)};
  if (auto path = variable("HALVOX_SOCKET"); !path.empty()) return {std::move(path)};
  std::vector<std::string> places;
  if (const auto directory = variable("XDG_RUNTIME_DIR"); directory.starts_with('/')) {
    places.push_back(directory + std::string(kBelowRuntimeDirectory));
  }
  places.push_back("/run" + std::string(kBelowRuntimeDirectory));
  return places;
}

bool meansAbsence(int error) {
  return error == ENOENT || error == ENOTDIR || error == ECONNREFUSED;
}

std::string describeTried(std::string_view what, const std::vector<TriedPlace>& tried) {
  std::string text = "no " + std::string(what);
  if (tried.size() == 1) {
    return text + " at " + tried.front().path + ": " +
           platform::linux_::errnoText(tried.front().error);
  }
  text += " found; tried ";
  for (const TriedPlace& place : tried) {
    if (&place != &tried.front()) text += ", then ";
    text += place.path + " (" + platform::linux_::errnoText(place.error) + ")";
  }
  return text;
}

}  // namespace halvox::client
