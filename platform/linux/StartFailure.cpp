#include "platform/linux/StartFailure.h"

#include <sysexits.h>

#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/store/StoreError.h"

namespace halvox::platform::linux_ {
namespace {

int exitStatus(StoreError::Kind kind) {
  switch (kind) {
    case StoreError::Kind::kDirectory:
      return EX_CANTCREAT;
    case StoreError::Kind::kInUse:
      return EX_UNAVAILABLE;
    case StoreError::Kind::kNewerVersion:
      return EX_DATAERR;
    case StoreError::Kind::kMissing:
    case StoreError::Kind::kDamaged:
    case StoreError::Kind::kCannotOpen:
      return EX_IOERR;
  }
  return EX_SOFTWARE;
}

int exitStatus(ConnectionOpenError::Kind kind) {
  switch (kind) {
    case ConnectionOpenError::Kind::kPathTooLong:
    case ConnectionOpenError::Kind::kUnknownGroup:
      return EX_CONFIG;
    case ConnectionOpenError::Kind::kNotPermitted:
      return EX_NOPERM;
    case ConnectionOpenError::Kind::kDirectoryMissing:
    case ConnectionOpenError::Kind::kDirectoryNotWritable:
    case ConnectionOpenError::Kind::kNotASocket:
      return EX_CANTCREAT;
    case ConnectionOpenError::Kind::kAlreadyServed:
    case ConnectionOpenError::Kind::kBusUnreachable:
    case ConnectionOpenError::Kind::kBusNameTaken:
      return EX_UNAVAILABLE;
    case ConnectionOpenError::Kind::kBadActivation:
      return EX_USAGE;
    case ConnectionOpenError::Kind::kSystem:
      return EX_OSERR;
  }
  return EX_SOFTWARE;
}

}  // namespace

StartFailure startFailure(const StoreError& error) {
  return {exitStatus(error.kind), error.description};
}

StartFailure startFailure(const ConnectionOpenError& error) {
  return {exitStatus(error.kind), error.description};
}

}  // namespace halvox::platform::linux_
