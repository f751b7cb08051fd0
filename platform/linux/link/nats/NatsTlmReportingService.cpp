#include "platform/linux/link/nats/NatsTlmReportingService.h"

#include <array>
#include <charconv>
#include <cstdio>
#include <random>
#include <utility>

#include "platform/linux/link/nats/NatsLog.h"
#include "platform/linux/link/nats/SubjectToken.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsTlmReportingService");

// Each thread has its own encoder, because an encoder reuses its buffer.
PayloadEncoder& encoder() {
  thread_local PayloadEncoder encoder;
  return encoder;
}

std::string randomName() {
  std::random_device device;
  std::array<char, 40> text{};
  std::snprintf(text.data(), text.size(), "%08x%08x", device(), device());
  return text.data();
}

void append(std::string& text, std::uint64_t number) {
  std::array<char, 24> digits;
  text.append(digits.data(), std::to_chars(digits.begin(), digits.end(), number).ptr);
}

std::string sessionIdOf(const Dictionary& sessionInfo) {
  const Value* const id = sessionInfo.find(kTLMReportingSessionInfoSessionID);
  return std::to_string(id == nullptr ? 0 : id->toInt64());
}

}  // namespace

LogCategory& natsLogCategory() {
  static LogCategory& category = platform::log().createCategory("com.tarno.halvox", "link");
  return category;
}

std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(Configuration::Link options,
                                                       const NatsEnvironment& environment) {
  return std::make_unique<NatsTlmReportingService>(std::move(options), environment);
}

// The data that all messages of one session have in common, encoded once. Immutable except for the
// ledger.
class NatsTlmReportingService::LinkedSession final : public TLMReportingSession {
 public:
  LinkedSession(const std::string& subject, const Dictionary& sessionInfo,
                const Dictionary& userInfo)
      : id_(sessionIdOf(sessionInfo)) {
    // The service name comes from a client's configuration and may be a value that is not a string.
    // It then counts as empty.
    const Value* const service = userInfo.find(kTLMReportingUserInfoServiceName);
    const std::string_view name = service == nullptr ? std::string_view() : service->string();
    subject_ = subject + "." + subjectToken(name) + "." + id_;
    beginning_ = R"({"sessionInfo":)";
    beginning_ += encoder().encode(sessionInfo);
    beginning_ += R"(,"userInfo":)";
    beginning_ += encoder().encode(userInfo);
    encoder().giveBackIfLong();
    beginning_ += R"(,"category":)";
    const Value* const batch = sessionInfo.find(kTLMReportingSessionInfoBatchEvent);
    if (batch != nullptr && batch->toBool()) ledger_ = std::make_shared<AckLedger>();
  }

  [[nodiscard]] std::string description() const override { return subject_; }
  [[nodiscard]] const std::string& subject() const { return subject_; }
  [[nodiscard]] const std::string& beginning() const { return beginning_; }
  // Null for a session that does not batch.
  [[nodiscard]] const std::shared_ptr<AckLedger>& ledger() const { return ledger_; }

 private:
  const std::string id_;
  std::string subject_;
  std::string beginning_;
  std::shared_ptr<AckLedger> ledger_;
};

NatsTlmReportingService::NatsTlmReportingService(Configuration::Link options,
                                                 const NatsEnvironment& environment)
    : subject_(options.subject),
      instance_(randomName()),
      dispatch_(environment.dispatch),
      link_(std::make_shared<NatsLink>(std::move(options), environment)) {}

NatsTlmReportingService::~NatsTlmReportingService() { static_cast<void>(close()); }

void NatsTlmReportingService::resume() { link_->resume(); }

bool NatsTlmReportingService::close() { return link_->close(); }

TLMReportingService::Token NatsTlmReportingService::TLMHierarchyTokenCreate() {
  std::string text = instance_ + "-";
  append(text, lastToken_.fetch_add(1, std::memory_order_relaxed) + 1);
  return std::make_shared<TLMSecureHierarchyToken>(std::move(text));
}

TLMReportingService::Session NatsTlmReportingService::TLMReportingCreateSession(
    const Dictionary& sessionInfo, const Dictionary& userInfo) {
  return std::make_shared<LinkedSession>(subject_, sessionInfo, userInfo);
}

void NatsTlmReportingService::TLMReportingStartConfiguration(const Session&,
                                                             BackendsCallback found) {
  link_->discover(std::move(found));
}

TLMReportingOutcome NatsTlmReportingService::TLMReportingSendMessage(
    const Session& session, const TLMReportingMessage& message) {
  return send(static_cast<const LinkedSession&>(*session), message);
}

TLMReportingOutcome NatsTlmReportingService::TLMReportingSendOneMessage(
    const Dictionary& sessionInfo, const Dictionary& userInfo, const TLMReportingMessage& message) {
  return send(LinkedSession(subject_, sessionInfo, userInfo), message);
}

TLMReportingOutcome NatsTlmReportingService::send(const LinkedSession& session,
                                                  const TLMReportingMessage& message) {
  if (auto ending = link_->refuseAtEnd()) return {.sent = false, .error = std::move(ending)};
  // Encode here, on the session's queue and not on the link's thread, because that one thread
  // serves all sessions.
  const std::string_view payload = encoder().encode(message.payload);
  std::string body;
  body.reserve(session.beginning().size() + payload.size() + 48);
  body += session.beginning();
  append(body, message.category);
  body += R"(,"type":)";
  append(body, message.type);
  body += R"(,"payload":)";
  body += payload;
  body += '}';
  encoder().giveBackIfLong();
  // The identifier is the same at each attempt. The stream therefore recognises a message that it
  // already has. Because of the random part, a restarted service does not use an identifier again.
  std::string id = instance_ + "-";
  append(id, lastMessage_.fetch_add(1, std::memory_order_relaxed) + 1);

  OutgoingMessage outgoing;
  const natsStatus status = makeMessage(session.subject().c_str(), id, body, outgoing);
  if (status != NATS_OK) {
    return {.sent = false, .error = Error{.description = natsStatus_GetText(status)}};
  }
  outgoing.ledger = session.ledger();
  // Add the message to the ledger before sending it, because its acknowledgement may arrive before
  // send() returns.
  if (outgoing.ledger) outgoing.number = outgoing.ledger->add();
  std::optional<Error> error = link_->send(std::move(outgoing));
  const bool sent = !error.has_value();
  return {.sent = sent, .error = std::move(error)};
}

void NatsTlmReportingService::TLMReportingFlushMessages(const Session& session,
                                                        std::function<void()> flushed) {
  const auto linked = std::static_pointer_cast<LinkedSession>(session);
  const std::shared_ptr<AckLedger>& ledger = linked->ledger();
  // A session that does not batch does not wait for acknowledgements.
  if (!ledger) return flushed();
  const AckLedger::FlushId flush = ledger->flush(
      [name = linked->subject(), flushed = std::move(flushed)](const AckTally& tally) {
        if (tally.notAcknowledged > 0) {
          kLog.error("flushed ", name, ": ", tally.acknowledged, " acknowledged, ",
                     tally.notAcknowledged, " not");
        } else if (tally.kept > 0) {
          kLog.info("flushed ", name, ": ", tally.acknowledged, " acknowledged, ", tally.kept,
                    " kept in the store");
        } else {
          kLog.info("flushed ", name, ": ", tally.acknowledged, " acknowledged, 0 not");
        }
        flushed();
      });
  if (flush == 0) return;
  // The job holds a weak reference, because it must not keep the ledger alive if the flush has
  // ended in time.
  dispatch_.asyncAfterOnBackgroundQueue(kFlushTime, [ledger = std::weak_ptr(ledger), flush] {
    if (const auto held = ledger.lock()) held->giveUp(flush);
  });
}

}  // namespace halvox::platform::linux_
