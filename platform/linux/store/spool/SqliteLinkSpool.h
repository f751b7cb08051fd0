#pragma once

#include <functional>
#include <optional>
#include <utility>

#include "platform/linux/store/SqliteStore.h"
#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

// The spool of the link in the store's database. Reads over a connection of its own, because the
// store's connection belongs to its writer.
// Threads and failures are those of LinkSpool. The store must outlive it.
class SqliteLinkSpool final : public LinkSpool {
 public:
  explicit SqliteLinkSpool(SqliteStore& store)
      : messages_(store.spooledMessages()), file_(store.databaseFile()) {}

  [[nodiscard]] bool canKeep() const override { return messages_.canKeep(); }
  [[nodiscard]] Number append(SpooledMessage message) override {
    return messages_.append(std::move(message));
  }
  [[nodiscard]] Number lastAppended() const override { return messages_.lastAppended(); }
  [[nodiscard]] bool hasUnstored() const override { return messages_.hasUnstored(); }
  [[nodiscard]] Result<Read, StoreError> readAfter(Number after) override;
  void removeThrough(Number number) override { messages_.removeThrough(number); }
  void onStored(std::function<void()> stored) override { messages_.onStored(std::move(stored)); }

 private:
  [[nodiscard]] SqliteCode open();
  [[nodiscard]] Failure<StoreError> failure() const;
  void close();

  SpooledMessages& messages_;
  const std::filesystem::path file_;
  // Used by the reading thread only.
  Database database_;
  std::optional<FileIdentity> identity_;  // of the open file
  Statement next_;
};

}  // namespace halvox::platform::linux_
