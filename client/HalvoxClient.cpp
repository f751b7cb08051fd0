#include "client/HalvoxClient.h"

#include <filesystem>
#include <system_error>
#include <utility>

#include "client/ClientWorker.h"
#include "client/ServicePlaces.h"

namespace halvox::client {

class HalvoxClient::Impl {
 public:
  explicit Impl(Options options) : worker(std::move(options)) {}
  ClientWorker worker;
};

HalvoxClient::HalvoxClient(Options options) : impl_(std::make_unique<Impl>(std::move(options))) {}

HalvoxClient::~HalvoxClient() = default;

void HalvoxClient::createSession(ReporterID id) { impl_->worker.post({id, CreateSession{}}); }

void HalvoxClient::setServiceType(ReporterID id, ServiceType type) {
  impl_->worker.post({id, type});
}

void HalvoxClient::setConfiguration(ReporterID id, Dictionary configuration) {
  impl_->worker.post({id, std::move(configuration)});
}

void HalvoxClient::start(ReporterID id) { impl_->worker.post({id, StartSession{}}); }

void HalvoxClient::stop(ReporterID id) { impl_->worker.post({id, StopSession{}}); }

void HalvoxClient::destroySession(ReporterID id) { impl_->worker.post({id, DestroySession{}}); }

bool HalvoxClient::send(ReporterID id, const Dictionary& message, Category category,
                        EventType type) {
  return sendTo(std::span(&id, 1), message, category, type);
}

bool HalvoxClient::send(const std::optional<std::vector<ReporterID>>& ids,
                        const Dictionary& message, Category category, EventType type) {
  if (ids) return sendTo(*ids, message, category, type);
  return impl_->worker.send(MessageView{std::nullopt, message, category, type});
}

bool HalvoxClient::sendTo(std::span<const ReporterID> ids, const Dictionary& message,
                          Category category, EventType type) {
  return impl_->worker.send(MessageView{ids, message, category, type});
}

[[gnu::hot]] bool HalvoxClient::send(ReporterID id, const EncodedDictionary& message,
                                     Category category, EventType type) {
  return sendTo(std::span(&id, 1), message, category, type);
}

[[gnu::hot]] bool HalvoxClient::sendTo(std::span<const ReporterID> ids,
                                       const EncodedDictionary& message, Category category,
                                       EventType type) {
  return impl_->worker.send(EncodedMessageView{ids, message, category, type});
}

[[gnu::hot]] bool HalvoxClient::sendToAll(const EncodedDictionary& message, Category category,
                                          EventType type) {
  return impl_->worker.send(EncodedMessageView{std::nullopt, message, category, type});
}

bool HalvoxClient::flush(std::chrono::milliseconds timeout) { return impl_->worker.flush(timeout); }

bool HalvoxClient::isConnected() const { return impl_->worker.isConnected(); }

Counters HalvoxClient::counters() const { return impl_->worker.counters(); }

void HalvoxClient::setConnectionHandler(std::function<void(bool connected)> handler) {
  impl_->worker.setConnectionHandler(std::move(handler));
}

std::string HalvoxClient::socketPath() const { return impl_->worker.socketPath(); }

std::string defaultSocketPath() {
  const auto places = socketPlaces();
  for (const std::string& place : places) {
    std::error_code ignored;
    if (std::filesystem::exists(place, ignored) || ignored) return place;
  }
  return places.front();
}

}  // namespace halvox::client
