#pragma once

#include <memory>
#include <string>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework over NATS: turns each message into one JSON object
//
//   {"sessionInfo":{…},"userInfo":{…},"category":n,"type":n,"payload":{…}}
//
// on the subject <subject>.<service name>.<session ID>, with an identifier by which the stream
// knows it again. A session that batches has its acknowledgements collected: its flush waits for
// them, at most kFlushTime. Nobody waits for those of other sessions; they are only counted.
// Any thread may call, as the port says; nothing blocks but close().
class NatsTlmReportingService final : public NatsTlmReporting {
 public:
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
  [[nodiscard]] bool close() override;

 private:
  class LinkedSession;

  TLMReportingOutcome send(const LinkedSession& session, const TLMReportingMessage& message);

  const std::string subject_;
  const std::string instance_;  // unlike that of any other run of any service
  DispatchService& dispatch_;
  std::atomic<std::uint64_t> lastToken_{0};  // orders with nothing, as the next one
  std::atomic<std::uint64_t> lastMessage_{0};
  const std::shared_ptr<NatsLink> link_;  // shared by those who wait for time to pass
};

}  // namespace halvox::platform::linux_
