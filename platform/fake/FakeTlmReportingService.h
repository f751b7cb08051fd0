#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/FakeDispatchService.h"
#include "platform/fake/Journal.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform {

// A real-time framework without servers: it keeps what it was given, and the test says how it
// answers. At first every discovery finds none, which is told when the test pumps the dispatch
// service, every flush is done before the call returns, and every message is sent. Any thread may
// call; the test steers and reads from its own.
class FakeTlmReportingService final : public TLMReportingService {
 public:
  enum class Answering : unsigned char {
    kLater,            // as a job of its own when the test pumps the dispatch service
    kBeforeReturning,  // a discovery on another thread, a flush on this one
    kWhenTold,
  };

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

  // Owns neither; the journal must outlive it, and the dispatch service must be there whenever it
  // answers later.
  FakeTlmReportingService(Journal& journal, FakeDispatchService& dispatch)
      : journal_(journal), dispatch_(dispatch) {}

  // From now on discoveries are answered so; `backends` counts unless the test tells each answer.
  void answerDiscoveries(Answering answering, std::optional<Array> backends = std::nullopt);
  // Answers the discovery that has waited longest, on this thread; false when none waits.
  bool answerDiscovery(const std::optional<Array>& backends);
  // kLater is not for flushes.
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
  void answer(Answering answering, BackendsCallback found, const std::optional<Array>& backends);

  Journal& journal_;
  FakeDispatchService& dispatch_;
  mutable std::mutex mutex_;
  Answering discoveries_ = Answering::kLater;
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
