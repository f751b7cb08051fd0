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

// A real-time framework without servers. It keeps the sessions and messages that it receives, and
// the test decides how it answers. At first every discovery finds no back-end and is answered when
// the test runs jobs, every flush ends before the call returns, and every message is sent. Any
// thread may call the service; only the test's thread calls the other functions. FakePlatform owns
// it.
class FakeTlmReportingService final : public TLMReportingService {
 public:
  enum class Answering : unsigned char {
    kLater,            // by a job of its own, when the test runs jobs
    kBeforeReturning,  // discoveries on another thread, flushes on the caller's
    kWhenTold,
  };

  // One message and its session.
  struct SentMessage {
    std::size_t session;  // counted from 1 in the order of creation; 0 outside of any session
    std::uint16_t category;
    std::uint16_t type;
    Dictionary payload;
  };
  struct Info {
    Dictionary sessionInfo;
    Dictionary userInfo;
  };

  // Does not own its arguments. The journal must outlive it, and the dispatch service must exist
  // whenever this service answers later.
  FakeTlmReportingService(Journal& journal, FakeDispatchService& dispatch)
      : journal_(journal), dispatch_(dispatch) {}

  // Sets how later discoveries are answered, and with which back-ends. With kWhenTold, the test
  // passes the back-ends with each answer.
  void answerDiscoveries(Answering answering, std::optional<Array> backends = std::nullopt);
  // Answers the oldest discovery, on this thread. Returns false if none waits.
  bool answerDiscovery(const std::optional<Array>& backends);
  // kLater is not allowed for flushes.
  void answerFlushes(Answering answering);
  // Ends the oldest flush, on this thread. Returns false if none waits.
  bool completeFlush();
  // Sets the outcome of later messages, inside and outside of sessions.
  void setOutcome(TLMReportingOutcome outcome);
  // Drops the callbacks that were not called.
  void clear();

  // The texts of the tokens that were made.
  [[nodiscard]] std::vector<std::string> tokens() const;
  // The arguments of each session, in the order of creation.
  [[nodiscard]] std::vector<Info> sessions() const;
  // The number of sessions that still exist.
  [[nodiscard]] std::size_t liveSessions() const;
  [[nodiscard]] std::size_t waitingDiscoveries() const;
  [[nodiscard]] std::size_t waitingFlushes() const;
  // The messages of sessions, whatever their outcome.
  [[nodiscard]] std::vector<SentMessage> messages() const;
  // The messages outside of sessions, and the arguments of their calls.
  [[nodiscard]] std::vector<SentMessage> singleMessages() const;
  [[nodiscard]] std::vector<Info> singleMessageInfos() const;

  Token TLMHierarchyTokenCreate() override;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) override;
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) override;
  // Sets the result of onlyNotesMessages(), which is false at first.
  void setOnlyNotesMessages(bool onlyNotes) { onlyNotesMessages_ = onlyNotes; }
  [[nodiscard]] bool onlyNotesMessages() const override { return onlyNotesMessages_; }
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
  bool onlyNotesMessages_ = false;
  std::vector<Info> infos_;
  std::vector<std::weak_ptr<TLMReportingSession>> sessions_;
  std::deque<BackendsCallback> waitingDiscoveries_;
  std::deque<std::function<void()>> waitingFlushes_;
  std::vector<SentMessage> messages_;
  std::vector<SentMessage> singleMessages_;
  std::vector<Info> singleMessageInfos_;
};

}  // namespace halvox::platform
