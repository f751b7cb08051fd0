#pragma once

#include <atomic>
#include <cstdint>

#include "platform/clock.h"
#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework of a machine without servers: every message becomes a record of
// the store, with the time of the call, in the order of the calls. There is one back-end, "local",
// and every discovery finds it.
//
// The store's writer commits a message within half a second, even if its session has ended. A flush
// therefore completes at once. The store counts the messages that it cannot write.
// Threads: any may call; a call blocks while the store's queue is full.
// Owner: the platform, which also owns the store, the clock and the callback thread. They must
// outlive this object and its sessions.
class LocalTlmReportingService final : public TLMReportingService {
 public:
  // Discoveries are answered on the thread of `callbacks`.
  LocalTlmReportingService(SqliteStore& store, const ClockService& clock, CallbackThread& callbacks)
      : records_(store.linkMessages()), clock_(clock), callbacks_(callbacks) {}

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) override;
  // Fails only after the store was closed.
  TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                              const TLMReportingMessage& message) override;
  void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) override;
  TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                 const Dictionary& userInfo,
                                                 const TLMReportingMessage& message) override;

 private:
  class LocalSession;

  TLMReportingOutcome record(std::shared_ptr<const LinkParty> party,
                             const TLMReportingMessage& message);

  LinkMessageRecords& records_;
  const ClockService& clock_;
  CallbackThread& callbacks_;
  std::atomic<std::uint64_t> lastToken_{0};  // orders nothing; only unique
};

}  // namespace halvox::platform::linux_
