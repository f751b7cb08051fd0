#include "service/HVReportingServiceProtocol.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <string>
#include <string_view>
#include <utility>

namespace halvox {
namespace {

using platform::Array;
using platform::Error;
using platform::ExportedObject;
using platform::InterfaceMethod;
using platform::Invocation;
using platform::MethodAccess;
using platform::MethodEffect;
using platform::ReplyCallback;
using platform::Value;

constexpr std::string_view kInterfaceName = "com.tarno.halvox.HVReportingServiceProtocol";
constexpr std::string_view kObjectPath = "/com/tarno/halvox/reporting";
constexpr std::string_view kInvalidArguments = "org.freedesktop.DBus.Error.InvalidArgs";

HVReportingServiceProtocol& service(ExportedObject& object) {
  return static_cast<HVReportingServiceProtocol&>(object);
}

ReporterID reporterID(const Value& value) { return static_cast<ReporterID>(value.toInt64()); }

// Narrowing loses nothing, because the connection has checked the argument's type against the
// signature.
template <typename Enumeration>
Enumeration enumeration(const Value& value) {
  return static_cast<Enumeration>(value.toUInt64());
}

BoolReply boolReply(ReplyCallback&& reply) {
  return [reply = std::move(reply)](const std::optional<Error>& error, bool value) {
    reply(error, value);
  };
}

ErrorReply errorReply(ReplyCallback&& reply) {
  return [reply = std::move(reply)](const std::optional<Error>& error) { reply(error, Value()); };
}

std::vector<ReporterID> reporterIDs(const Array& numbers) {
  std::vector<ReporterID> result;
  result.reserve(numbers.size());
  std::transform(numbers.begin(), numbers.end(), std::back_inserter(result), reporterID);
  return result;
}

Array numbers(const std::vector<ReporterID>& reporters) {
  std::vector<Value> values;
  values.reserve(reporters.size());
  for (const ReporterID reporter : reporters)
    values.emplace_back(static_cast<std::int64_t>(reporter));
  return Array(values);
}

void invokeCreate(ExportedObject& object, Invocation&& request) {
  service(object).createReportingSession(reporterID(request.arguments[0]),
                                         boolReply(std::move(request.reply)),
                                         std::move(request.context));
}

void invokeSetServiceType(ExportedObject& object, Invocation&& request) {
  service(object).setServiceType(enumeration<AudioServiceType>(request.arguments[0]),
                                 reporterID(request.arguments[1]),
                                 boolReply(std::move(request.reply)), std::move(request.context));
}

void invokeGetServiceName(ExportedObject& object, Invocation&& request) {
  service(object).getServiceNameForReporterID(
      reporterID(request.arguments[0]),
      [reply = std::move(request.reply)](const std::optional<Error>& error,
                                         AudioServiceType serviceType) {
        reply(error, static_cast<std::uint16_t>(serviceType));
      },
      std::move(request.context));
}

void invokeSetConfiguration(ExportedObject& object, Invocation&& request) {
  service(object).setConfiguration(request.arguments[0].dictionary(),
                                   reporterID(request.arguments[1]),
                                   boolReply(std::move(request.reply)), std::move(request.context));
}

void invokeStart(ExportedObject& object, Invocation&& request) {
  service(object).startReportingSessionForID(reporterID(request.arguments[0]),
                                             boolReply(std::move(request.reply)),
                                             std::move(request.context));
}

// Lets the connection layer refuse a message with too many reporter IDs before the IDs are copied.
std::size_t countReporterIDs(std::span<const Value> arguments) {
  const Array lists = arguments[3].array();
  return lists.empty() ? 0 : lists[0].array().size();
}

// The wire has no null. The list is wrapped in another one, which is empty if there is no list.
Error tooManyLists(std::size_t count) {
  return {
      .description = "sendMessage: argument 4: expected at most one list of reporter IDs, found " +
                     std::to_string(count),
      .name = std::string(kInvalidArguments)};
}

void invokeSendMessage(ExportedObject& object, Invocation&& request) {
  const Array lists = request.arguments[3].array();
  if (lists.size() > 1) return request.reply(tooManyLists(lists.size()), Value());
  HVReportingServiceProtocol::ReporterIDs reporters;
  if (!lists.empty()) {
    reporters = reporterIDs(lists[0].array());
  }
  service(object).sendMessage(
      request.arguments[0].dictionary(), enumeration<AudioEventCategory>(request.arguments[1]),
      enumeration<AudioEventType>(request.arguments[2]), std::move(reporters),
      errorReply(std::move(request.reply)), std::move(request.context));
}

void postSendMessage(ExportedObject& object, std::span<const Value> arguments,
                     platform::PostedRequest&& request, platform::ProcessID sender) {
  const Array lists = arguments[3].array();
  if (lists.size() > 1) return request.answer(tooManyLists(lists.size()), Value());
  std::optional<Array> reporters;
  if (!lists.empty()) reporters = lists[0].array();
  service(object).postMessage(
      arguments[0].dictionary(), enumeration<AudioEventCategory>(arguments[1]),
      enumeration<AudioEventType>(arguments[2]), std::move(reporters), std::move(request), sender);
}

void invokeStop(ExportedObject& object, Invocation&& request) {
  service(object).stopReportingSessionForID(reporterID(request.arguments[0]),
                                            boolReply(std::move(request.reply)),
                                            std::move(request.context));
}

void invokeDestroy(ExportedObject& object, Invocation&& request) {
  service(object).destroyReportingSession(reporterID(request.arguments[0]),
                                          boolReply(std::move(request.reply)),
                                          std::move(request.context));
}

void invokeReporterIDValid(ExportedObject& object, Invocation&& request) {
  service(object).reporterIDValid(
      reporterID(request.arguments[0]),
      [reply = std::move(request.reply)](const std::optional<Error>& error,
                                         const platform::Dictionary& dictionary) {
        reply(error, dictionary);
      },
      std::move(request.context));
}

void invokeGetAllReporters(ExportedObject& object, Invocation&& request) {
  service(object).getAllReporters(
      [reply = std::move(request.reply)](const std::optional<Error>& error,
                                         const std::vector<ReporterID>& reporters) {
        reply(error, numbers(reporters));
      },
      std::move(request.context));
}

void invokeKillService(ExportedObject& object, Invocation&& request) {
  service(object).killService(boolReply(std::move(request.reply)));
}

// The three time stamps and the tag.
constexpr std::size_t kEntriesAddedToMessage = 4;

constexpr MethodEffect kMore = MethodEffect::kMayHoldMore;
constexpr MethodEffect kNoMore = MethodEffect::kHoldsNoMore;

// The effects decide which requests a client over its limit may still make. The requests that let
// it recover, above all stops and destroys, do not make the service hold more.
constexpr std::array kMethods{
    InterfaceMethod{"createReportingSession", "x", "b", MethodEffect::kMakesSession, invokeCreate},
    InterfaceMethod{"setServiceType", "qx", "b", kNoMore, invokeSetServiceType},
    InterfaceMethod{"getServiceNameForReporterID", "x", "q", kNoMore, invokeGetServiceName},
    InterfaceMethod{"setConfiguration", "a{sv}x", "b", kMore, invokeSetConfiguration},
    InterfaceMethod{"startReportingSessionForID", "x", "b", kMore, invokeStart},
    InterfaceMethod{"sendMessage", "a{sv}uqaax", "", kMore, invokeSendMessage, countReporterIDs,
                    MethodAccess::kAnybody, kEntriesAddedToMessage, postSendMessage},
    InterfaceMethod{"stopReportingSessionForID", "x", "b", kNoMore, invokeStop},
    InterfaceMethod{"destroyReportingSession", "x", "b", kNoMore, invokeDestroy},
    InterfaceMethod{"reporterIDValid", "x", "a{sv}", kNoMore, invokeReporterIDValid},
    InterfaceMethod{"getAllReporters", "", "ax", kNoMore, invokeGetAllReporters},
    // Only the owner may call it, because any user who can connect could otherwise end the service
    // for all others.
    InterfaceMethod{"killService", "", "b", kNoMore, invokeKillService, nullptr,
                    MethodAccess::kOwner},
};

}  // namespace

const platform::NSXPCInterface& HVReportingServiceInterface() {
  static constexpr platform::NSXPCInterface kInterface{kInterfaceName, kObjectPath, kMethods};
  return kInterface;
}

}  // namespace halvox
