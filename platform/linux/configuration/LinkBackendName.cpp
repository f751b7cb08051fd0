#include "platform/linux/configuration/LinkBackendName.h"

namespace halvox::platform::linux_ {

const char* linkBackendName(LinkBackend backend) {
  switch (backend) {
    case LinkBackend::kLocal:
      return "local";
    case LinkBackend::kNats:
      return "nats";
    case LinkBackend::kNone:
      return "none";
  }
  return "";
}

}  // namespace halvox::platform::linux_
