#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform {

// A real-time framework without servers: it keeps what it was given, and the test says how it
// answers. At first every discovery finds none and every flush is done before the call returns, and
// every message is sent. Any thread may call; the test steers and reads from its own.
class FakeTlmReportingService final : public TLMReportingService {
 public:
  enum class Answering : unsigned char { kBeforeReturning, kWhenTold };

  // One message, with what its session or, outside any session, its call said of it.
  struct SentMessage {
    std::size_t session;  // from 1 on in the order of creation; 0 outside any session
    std::uint16_t category;
    std::uint16_t type;
    Dictionary payload;
  };
  struct Info {
    Dictionary sessionInfo;
    Dictionary userInfo;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeTlmReportingService(Journal& journal) : journal_(journal) {}

  // From now on discoveries are answered so; `backends` counts only before returning.
  void answerDiscoveries(Answering answering, std::optional<Array> backends = std::nullopt);
  // Answers the discovery that has waited longest, on this thread; false when none waits.
  bool answerDiscovery(const std::optional<Array>& backends);
  void answerFlushes(Answering answering);
  // Ends the flush that has waited longest, on this thread; false when none waits.
  bool completeFlush();
  // From now on messages fare so, in sessions and outside.
  void setOutcome(TLMReportingOutcome outcome);
  // Drops the callbacks that were not called.
  void clear();

  // The texts of the tokens that were made.
  [[nodiscard]] std::vector<std::string> tokens() const;
  // What each session was made with, in order of creation.
  [[nodiscard]] std::vector<Info> sessions() const;
  // Number of sessions that somebody still holds.
  [[nodiscard]] std::size_t liveSessions() const;
  [[nodiscard]] std::size_t waitingDiscoveries() const;
  [[nodiscard]] std::size_t waitingFlushes() const;
  // The messages given to sessions, whatever became of them.
  [[nodiscard]] std::vector<SentMessage> messages() const;
  // The messages given outside sessions, and what was given with them.
  [[nodiscard]] std::vector<SentMessage> singleMessages() const;
  [[nodiscard]] std::vector<Info> singleMessageInfos() const;

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) override;
  TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                              const TLMReportingMessage& message) override;
  void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) override;
  TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                 const Dictionary& userInfo,
                                                 const TLMReportingMessage& message) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  Answering discoveries_ = Answering::kBeforeReturning;
  Answering flushes_ = Answering::kBeforeReturning;
  std::optional<Array> backends_;
  TLMReportingOutcome outcome_{.sent = true};
  std::vector<std::string> tokens_;
  std::vector<Info> infos_;
  std::vector<std::weak_ptr<TLMReportingSession>> sessions_;
  std::deque<BackendsCallback> waitingDiscoveries_;
  std::deque<std::function<void()>> waitingFlushes_;
  std::vector<SentMessage> messages_;
  std::vector<SentMessage> singleMessages_;
  std::vector<Info> singleMessageInfos_;
};

}  // namespace halvox::platform
