#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegate.h"

namespace halvox {

// A service on fakes, with functions that play its clients. Requests have been carried out when a
// function returns, except with post().
class ServiceFixture : public testing::Test {
 protected:
  using Connection = std::shared_ptr<platform::FakeConnection>;
  using Call = std::shared_ptr<platform::FakeCall>;

  ServiceFixture() {
    platform_.connections.serviceListener().setDelegate(*delegate_);
    forgetSteps();  // the delegate's construction logs too
  }

  // Connects a new process. connect() also waits for the registration.
  Connection connectUnregistered(platform::ProcessID pid, const std::string& name = "player") {
    platform_.process.addProcess(pid, name);
    return platform_.connections.connect(pid);
  }
  Connection connect(platform::ProcessID pid, const std::string& name = "player") {
    Connection connection = connectUnregistered(pid, name);
    run();
    return connection;
  }
  void run() { platform_.dispatch.runUntilIdle(); }

  static Call post(const Connection& from, std::string_view method,
                   std::vector<platform::Value> arguments) {
    return from->call(method, std::move(arguments));
  }
  Call call(const Connection& from, std::string_view method,
            std::vector<platform::Value> arguments) {
    Call made = post(from, method, std::move(arguments));
    run();
    return made;
  }
  Call create(const Connection& from, std::int64_t id) {
    return call(from, "createReportingSession", {id});
  }
  Call start(const Connection& from, std::int64_t id) {
    return call(from, "startReportingSessionForID", {id});
  }
  Call stop(const Connection& from, std::int64_t id) {
    return call(from, "stopReportingSessionForID", {id});
  }
  Call destroy(const Connection& from, std::int64_t id) {
    return call(from, "destroyReportingSession", {id});
  }
  Call setServiceType(const Connection& from, AudioServiceType type, std::int64_t id) {
    return call(from, "setServiceType", {static_cast<std::uint16_t>(type), id});
  }
  Call createAndStart(const Connection& from, std::int64_t id) {
    create(from, id);
    return start(from, id);
  }
  // Sends to the named sessions.
  Call send(const Connection& from, const platform::Array& ids,
            const platform::Dictionary& message = {{"a", 1}}) {
    const std::vector<platform::Value> lists{ids};
    return call(from, "sendMessage", {message, kCategory, kType, platform::Array(lists)});
  }
  // Sends to all active sessions.
  Call sendToAll(const Connection& from, const platform::Dictionary& message = {{"a", 1}}) {
    return call(from, "sendMessage", {message, kCategory, kType, platform::Array{}});
  }

  static std::shared_ptr<HVReportingClientServerInstance> clientOf(const Connection& connection) {
    return std::static_pointer_cast<HVReportingClientServerInstance>(connection->exportedObject());
  }
  static std::shared_ptr<HVReportingSession> sessionOf(const Connection& connection,
                                                       std::int64_t id) {
    return clientOf(connection)
        ->findReportingSessionForID(ReporterID{id},
                                    HVReportingClientServerInstance::Lookup::kOwnSessions);
  }
  static std::size_t historySize(const Connection& connection, std::int64_t id) {
    const auto session = sessionOf(connection, id);
    const auto history = session->nestedAggregatedPayloadData();
    return history->has_value() ? (*history)->size() : 0;
  }

  void forgetSteps() {
    platform_.journal.clear();
    platform_.log.clear();
    platform_.kdebug.clear();
    platform_.analytics.clear();
  }
  // Everything that was logged, traced, tested, sent and answered, in order. Excludes the work of
  // the sessions' links, which run on queues of their own.
  std::vector<std::string> steps() const {
    std::vector<std::string> texts;
    for (const platform::JournalEntry& entry : platform_.journal.entries()) {
      if (entry.kind != platform::JournalKind::kLink) texts.push_back(entry.text);
    }
    std::erase_if(texts, isOfALink);
    return texts;
  }
  std::vector<std::string> lines(platform::LogLevel level) const {
    std::vector<std::string> texts = platform_.log.texts(level);
    std::erase_if(texts, isOfALink);
    return texts;
  }
  static bool isOfALink(const std::string& text) {
    return text.starts_with("entering tlmreporting ") || text == "waiting to find backends" ||
           text == "failed to find backend" || text.starts_with("no backends found") ||
           text == "stopping and setting session to nil";
  }

  static platform::FakeCall::Reply ok(const platform::Value& value) {
    return {std::nullopt, value};
  }

  static constexpr std::uint32_t kCategory = 4;  // Playback
  static constexpr std::uint16_t kType = 1;      // Start

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingServiceDelegate> delegate_ =
      std::make_shared<HVReportingServiceDelegate>();
};

}  // namespace halvox
