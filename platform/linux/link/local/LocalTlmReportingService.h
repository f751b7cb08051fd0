#pragma once

#include "platform/clock.h"
#include "platform/linux/link/local/ServerlessTlmReportingService.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework of a machine without servers. Every message becomes a record of
// the store, with the time of the call and in the order of the calls. There is one back-end,
// "local", and every discovery finds it.
//
// The store's writer commits a message within half a second, even if its session has ended. A flush
// therefore completes at once. The store counts the messages that it cannot write.
// Threads: any may call; a call blocks while the store's queue is full.
// Owner: the platform, which also owns the store, the clock and the callback thread. They must
// outlive this object and its sessions.
class LocalTlmReportingService final : public ServerlessTlmReportingService {
 public:
  // `callbacks` answers discoveries on its thread.
  LocalTlmReportingService(SqliteStore& store, const ClockService& clock,
                           CallbackThread& callbacks);

  // Returns false while many records wait for the store. A send may then have to wait, and the
  // thread that carries out the requests of all clients must not wait.
  [[nodiscard]] bool onlyNotesMessages() const override { return !store_.isBehind(); }

 private:
  // Refuses a message only after the store was closed.
  TLMReportingOutcome accept(const std::shared_ptr<const LinkParty>& sender,
                             const TLMReportingMessage& message) override;

  const SqliteStore& store_;
  LinkMessageRecords& records_;
  const ClockService& clock_;
};

}  // namespace halvox::platform::linux_
