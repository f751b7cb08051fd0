#include "platform/linux/testing/ScratchDirectory.h"

#include <cstdlib>
#include <stdexcept>
#include <system_error>

namespace halvox::platform::linux_ {

ScratchDirectory::ScratchDirectory() {
  std::string name = (std::filesystem::temp_directory_path() / "halvox-test.XXXXXX").string();
  if (::mkdtemp(name.data()) == nullptr) {
    throw std::runtime_error("cannot create the scratch directory " + name);
  }
  path_ = name;
}

ScratchDirectory::~ScratchDirectory() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

}  // namespace halvox::platform::linux_
