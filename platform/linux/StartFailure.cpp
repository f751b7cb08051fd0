#include "platform/linux/StartFailure.h"

#include <sysexits.h>

#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/store/StoreError.h"

namespace halvox::platform::linux_ {
namespace {

int exitStatus(StoreError error) {
  switch (error) {
    case StoreError::kDirectory:
      return EX_CANTCREAT;
    case StoreError::kInUse:
      return EX_UNAVAILABLE;
    case StoreError::kNewerVersion:
      return EX_DATAERR;
    case StoreError::kMissing:
    case StoreError::kDamaged:
    case StoreError::kCannotOpen:
      return EX_IOERR;
  }
  return EX_SOFTWARE;
}

int exitStatus(ConnectionOpenError error) {
  switch (error) {
    case ConnectionOpenError::kPathTooLong:
    case ConnectionOpenError::kUnknownGroup:
      return EX_CONFIG;
    case ConnectionOpenError::kNotPermitted:
      return EX_NOPERM;
    case ConnectionOpenError::kDirectoryMissing:
    case ConnectionOpenError::kDirectoryNotWritable:
    case ConnectionOpenError::kNotASocket:
      return EX_CANTCREAT;
    case ConnectionOpenError::kAlreadyServed:
    case ConnectionOpenError::kBusUnreachable:
    case ConnectionOpenError::kBusNameTaken:
      return EX_UNAVAILABLE;
    case ConnectionOpenError::kBadActivation:
      return EX_USAGE;
    case ConnectionOpenError::kSystem:
      return EX_OSERR;
  }
  return EX_SOFTWARE;
}

}  // namespace

Failure<int> startFailure(const Failure<StoreError>& failure) {
  return {exitStatus(failure.code), failure.message};
}

Failure<int> startFailure(const Failure<ConnectionOpenError>& failure) {
  return {exitStatus(failure.code), failure.message};
}

}  // namespace halvox::platform::linux_
