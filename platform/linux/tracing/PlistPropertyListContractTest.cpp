// The contract of property lists, run on libplist.

#include <fstream>

#include "platform/fake/contracts/PropertyListContract.h"
#include "platform/linux/testing/ScratchDirectory.h"
#include "platform/linux/tracing/PlistPropertyListService.h"

namespace halvox::platform::contract {
namespace {

std::string toXml(const Value& value) {
  if (value.isDictionary()) {
    std::string text = "<dict>";
    for (const auto& [key, member] : value.dictionary()) {
      text += "<key>" + std::string(key.text()) + "</key>" + toXml(member);
    }
    return text + "</dict>";
  }
  if (value.isArray()) {
    std::string text = "<array>";
    for (const Value& item : value.array()) text += toXml(item);
    return text + "</array>";
  }
  const std::string text = describe(value);
  if (value.isString()) return "<string>" + text + "</string>";
  if (value.numberKind() == NumberKind::kBool) return value.toBool() ? "<true/>" : "<false/>";
  if (value.numberKind() == NumberKind::kDouble) return "<real>" + text + "</real>";
  return "<integer>" + text + "</integer>";
}

class PlistPropertyListHarness {
 public:
  PropertyListService& service() { return service_; }
  std::string write(const std::string& name, const Value& root) {
    return put(name, "<plist version=\"1.0\">" + toXml(root) + "</plist>");
  }
  std::string writeBroken(const std::string& name) { return put(name, "neither"); }
  std::string missing() { return (directory_.path() / "missing").string(); }

 private:
  std::string put(const std::string& name, const std::string& text) {
    const auto path = directory_.path() / name;
    std::ofstream(path) << text;
    return path.string();
  }

  const linux_::ScratchDirectory directory_;
  linux_::PlistPropertyListService service_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Plist, PropertyListContract, PlistPropertyListHarness);

}  // namespace halvox::platform::contract
