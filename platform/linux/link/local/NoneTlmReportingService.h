#pragma once

#include <atomic>
#include <cstdint>

#include "platform/linux/link/local/CallbackThread.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework of a service whose link is disabled: no discovery finds a
// back-end, and every message is counted and refused.
// Threads: any may call; nothing blocks. Owner: the platform, which also owns the objects of the
// constructor; they must outlive this one.
class NoneTlmReportingService final : public TLMReportingService {
 public:
  // Discoveries are answered on the thread of `callbacks`.
  NoneTlmReportingService(StatisticsService& statistics, CallbackThread& callbacks)
      : callbacks_(callbacks),
        received_(statistics.counter("link none", "received")),
        dropped_(statistics.counter("link none", "dropped: no back-end")) {}

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  // Calls `found` with nothing.
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) override;
  TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                              const TLMReportingMessage& message) override;
  void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) override;
  TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                 const Dictionary& userInfo,
                                                 const TLMReportingMessage& message) override;

 private:
  TLMReportingOutcome refuse();

  CallbackThread& callbacks_;
  std::atomic<std::uint64_t> lastToken_{0};  // orders nothing; only unique
  Counter& received_;
  Counter& dropped_;
};

}  // namespace halvox::platform::linux_
