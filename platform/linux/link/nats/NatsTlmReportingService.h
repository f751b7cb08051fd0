#pragma once

#include <memory>
#include <string>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework over NATS. Encodes each message as one JSON object
//
//   {"sessionInfo":{…},"userInfo":{…},"category":n,"type":n,"payload":{…}}
//
// and publishes it on the subject <subject>.<service name>.<session ID>, with an identifier by
// which the stream recognises a second copy. A flush of a session that batches waits for the
// acknowledgements of its messages, but no longer than kFlushTime. A flush of any other session
// ends at once; the acknowledgements of its messages are only counted.
// Threads: any, as the port requires; only close() blocks.
// Failures: a message that cannot be accepted is answered with an error. NatsLink says what happens
// to accepted messages.
class NatsTlmReportingService final : public NatsTlmReporting {
 public:
  // Long enough for a second attempt to publish; see NatsPublisher. After this time, the flush
  // reports how many messages are not acknowledged.
  static constexpr std::chrono::seconds kFlushTime{5};

  NatsTlmReportingService(Configuration::Link options, const NatsEnvironment& environment);
  ~NatsTlmReportingService() override;

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
  void resume() override;
  [[nodiscard]] bool close() override;

 private:
  class LinkedSession;

  TLMReportingOutcome send(const LinkedSession& session, const TLMReportingMessage& message);

  const std::string subject_;
  const std::string instance_;  // random, unique to this run of the service
  DispatchService& dispatch_;
  std::atomic<std::uint64_t> lastToken_{0};  // both are relaxed: they order no other memory
  std::atomic<std::uint64_t> lastMessage_{0};
  const std::shared_ptr<NatsLink> link_;  // shared with delayed jobs of the link
};

}  // namespace halvox::platform::linux_
