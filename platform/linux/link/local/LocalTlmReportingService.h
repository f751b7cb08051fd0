#pragma once

#include <atomic>
#include <cstdint>

#include "platform/clock.h"
#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework of a machine on its own: every message becomes a record of the
// store, under the time of the call, in the order of the calls. There is one back-end, called
// "local", and it is always found.
//
// A message that was sent is with the store's writer, which has it in the database within half a
// second whoever ends its session meanwhile; so a flush is done at once. What the store then
// cannot keep, it counts. Any thread may call; calls wait while the store has no room. Does not own
// what it is made with, which must outlive it and its sessions.
class LocalTlmReportingService final : public TLMReportingService {
 public:
  // Answers discoveries on that thread.
  LocalTlmReportingService(SqliteStore& store, const ClockService& clock, CallbackThread& callbacks)
      : records_(store.linkMessages()), clock_(clock), callbacks_(callbacks) {}

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) override;
  // Fails only when the store is closed already.
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
  std::atomic<std::uint64_t> lastToken_{0};  // orders with nothing: only unlike the others
};

}  // namespace halvox::platform::linux_
