#include "platform/linux/store/StoredKinds.h"

#include "platform/linux/store/StoreFiles.h"

namespace halvox::platform::linux_ {

Result<void, StoreError> openUnserved(StoreFiles& files, const StoreSizes& sizes,
                                      Database& database) {
  const bool mustCheck = files.logBytes() > 0;
  if (auto opened = openIntactDatabase(files, sizes, database); !opened) return opened;
  // Emptying the log removes the sign by which a service knows that it must check its database.
  // The check must therefore come first.
  if (!mustCheck) return {};
  Statement check;
  const bool isSound = database.prepare("PRAGMA quick_check(1)", check) == SQLITE_OK &&
                       check.step() == SQLITE_ROW && check.text(0) == "ok";
  check = {};
  if (isSound) return {};
  abandon(database);
  return Failure<StoreError>{StoreError::kDamaged,
                             files.database().native() + ": the database is damaged"};
}

}  // namespace halvox::platform::linux_
