// The contract of preferences, run on the adapter.

#include "platform/fake/contracts/PreferenceContract.h"

#include <filesystem>
#include <fstream>
#include <map>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/settings/PreferenceReader.h"
#include "platform/linux/settings/TomlPreferenceService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::contract {
namespace {

std::string tomlText(const Value& value) {
  if (value.isString()) return "\"" + std::string(value.string()) + "\"";
  if (value.numberKind() == NumberKind::kBool) return value.toBool() ? "true" : "false";
  if (value.numberKind() == NumberKind::kDouble) return std::to_string(value.toDouble());
  return std::to_string(value.toInt64());
}

class TomlHarness {
 public:
  PreferenceService& service() { return service_; }
  void set(const std::string& domain, const std::string& key, const Value& value) {
    domains_[domain][key] = tomlText(value);
    write(domain);
  }
  void remove(const std::string& domain, const std::string& key) {
    domains_[domain].erase(key);
    write(domain);
  }

 private:
  void write(const std::string& domain) {
    const auto directory = scratch_.path() / "preferences/mobile";
    std::filesystem::create_directories(directory);
    std::ofstream file(directory / (domain + ".toml"));
    for (const auto& [key, text] : domains_[domain]) file << key << " = " << text << '\n';
  }

  const linux_::ScratchDirectory scratch_;
  std::map<std::string, std::map<std::string, std::string>> domains_;
  FakePlatform platform_;
  linux_::PreferenceReader reader_{scratch_.path() / "preferences", platform_.log};
  linux_::TomlPreferenceService service_{reader_, platform_.statistics};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Toml, PreferenceContract, TomlHarness);

}  // namespace halvox::platform::contract
