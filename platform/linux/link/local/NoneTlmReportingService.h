#pragma once

#include <atomic>
#include <cstdint>

#include "platform/linux/link/local/CallbackThread.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework where there is nobody to report to: no back-end is ever found,
// and what is sent nevertheless is counted and refused. Any thread may call. Does not own what it
// is made with, which must outlive it.
class NoneTlmReportingService final : public TLMReportingService {
 public:
  // Answers discoveries on that thread.
  NoneTlmReportingService(StatisticsService& statistics, CallbackThread& callbacks)
      : callbacks_(callbacks),
        received_(statistics.counter("link none", "received")),
        dropped_(statistics.counter("link none", "dropped: no back-end")) {}

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  // Calls back with none.
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
  std::atomic<std::uint64_t> lastToken_{0};  // orders with nothing: only unlike the others
  Counter& received_;
  Counter& dropped_;
};

}  // namespace halvox::platform::linux_
