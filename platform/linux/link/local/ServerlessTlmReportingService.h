#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/store/LinkParty.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The common part of the real-time reporting frameworks that have no servers. Each message is
// accepted or refused during the call. A flush therefore completes at once. Every discovery finds
// the same back-ends.
// Threads: any may call. Owner: the platform, which also owns the callback thread; it must outlive
// this object.
class ServerlessTlmReportingService : public TLMReportingService {
 public:
  // The text of the token begins with the name of the framework.
  Token TLMHierarchyTokenCreate() final;
  Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                    const Dictionary& userInfo) final;
  void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) final;
  TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                              const TLMReportingMessage& message) final;
  [[nodiscard]] bool onlyNotesMessages() const override { return true; }
  void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) final;
  TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                 const Dictionary& userInfo,
                                                 const TLMReportingMessage& message) final;

 protected:
  static constexpr const char* kErrorDomain = "com.tarno.halvox.link";

  // Every discovery is answered with `backends`, on the thread of `callbacks`.
  ServerlessTlmReportingService(std::string name, std::optional<Array> backends,
                                CallbackThread& callbacks)
      : name_(std::move(name)), backends_(std::move(backends)), callbacks_(callbacks) {}

 private:
  class PartySession;

  // Accepts or refuses one message of `sender`, on the caller's thread.
  virtual TLMReportingOutcome accept(const std::shared_ptr<const LinkParty>& sender,
                                     const TLMReportingMessage& message) = 0;

  const std::string name_;
  const std::optional<Array> backends_;
  CallbackThread& callbacks_;
  std::atomic<std::uint64_t> lastToken_{0};  // orders no other memory; only makes tokens unique
};

}  // namespace halvox::platform::linux_
