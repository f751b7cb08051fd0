#include "tools/ServiceConfiguration.h"

#include <cerrno>
#include <cstdlib>
#include <system_error>
#include <utility>
#include <vector>

#include <sys/stat.h>

#include "client/ServicePlaces.h"
#include "platform/linux/configuration/ConfigurationEnvironment.h"
#include "platform/linux/configuration/ConfiguredFeatureFlagService.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::tools {
namespace {

using platform::linux_::Configuration;
using platform::linux_::kStoreFileName;

bool isSocketInTheEnvironment() {
  const char* value = std::getenv("HALVOX_SOCKET");
  return value != nullptr && *value != '\0';
}

// The first of the usual places that holds a store.
struct StoreSearch {
  std::filesystem::path directory;  // the user's if there is no store
  bool isThere = false;
  std::vector<client::TriedPlace> tried{};  // without success
};

StoreSearch searchStore() {
  StoreSearch search{.directory = platform::linux_::userStorageDirectory()};
  for (const auto& directory : {search.directory, platform::linux_::systemStorageDirectory()}) {
    const auto database = directory / kStoreFileName;
    struct stat status {};
    // A store that this user may not read counts as present: the error then names it.
    if (::stat(database.c_str(), &status) == 0 || !client::meansAbsence(errno)) {
      search.directory = directory;
      search.isThere = true;
      return search;
    }
    search.tried.push_back({database.native(), errno});
  }
  return search;
}

std::variant<Configuration, ExitStatus> configurationWith(const StoreSearch& search,
                                                          const Complaint& complain) {
  auto loaded =
      platform::linux_::loadConfiguration({.socket = {}, .storageDirectory = search.directory});
  if (!loaded) return complain(ExitStatus::kBadConfiguration, loaded.error().message);
  return *std::move(loaded);
}

}  // namespace

std::variant<Configuration, ExitStatus> serviceConfiguration(const Complaint& complain) {
  return configurationWith(searchStore(), complain);
}

std::variant<std::string, ExitStatus> namedSocket(const CommonOptions& options,
                                                  const Complaint& complain) {
  // The client library reads $HALVOX_SOCKET itself. If it is set, the configuration is not read and
  // cannot fail.
  if (!options.socket.empty() || isSocketInTheEnvironment()) return options.socket;
  const auto named = platform::linux_::configuredSocket();
  if (named) return named->native();
  return complain(ExitStatus::kBadConfiguration, named.error().message);
}

bool isInternalBuild(const Configuration& configuration) {
  const platform::Value* value = configuration.device.find("InternalBuild");
  return value != nullptr && value->isNumber() && value->toBool();
}

bool isTracingOn(const Configuration& configuration) {
  const platform::linux_::ConfiguredFeatureFlagService features(configuration.features);
  return features._os_feature_enabled_impl("Acoustat", "Tracing");
}

std::variant<std::filesystem::path, ExitStatus> findStore(const Complaint& complain) {
  const StoreSearch search = searchStore();
  auto configuration = configurationWith(search, complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  auto& directory = std::get<Configuration>(configuration).storage.directory;
  // Any other directory was named by the configuration. That directory is not checked here, because
  // the error of the reader names it.
  if (search.isThere || directory != search.directory) return std::move(directory);
  return complain(ExitStatus::kNoService, client::describeTried("store", search.tried), "no-store");
}

std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path Configuration::*configured,
    const Complaint& complain) {
  if (!named.empty()) {
    std::error_code error;
    // Fails if the working directory was deleted.
    auto path = std::filesystem::absolute(named, error);
    if (!error) return path;
    return complain(ExitStatus::kBadArguments, "--directory: " + named + ": " + error.message());
  }
  auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  return std::get<Configuration>(configuration).*configured;
}

}  // namespace halvox::tools
