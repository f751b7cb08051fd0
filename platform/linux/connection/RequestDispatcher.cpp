#include "platform/linux/connection/RequestDispatcher.h"

#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include <unistd.h>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/ErrorNames.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_ {
namespace {

// Returns the name in quotes, cut if it is long. The names in a header have been checked, but a
// path can be as long as the message.
std::string quoted(std::string_view name) {
  constexpr std::size_t kMaxShown = 255;
  std::string text = "\"";
  text += name.substr(0, kMaxShown);
  if (name.size() > kMaxShown) text += "...";
  return text += '"';
}

const InterfaceMethod* findMethod(const NSXPCInterface& interface, std::string_view name) {
  for (const InterfaceMethod& method : interface.methods) {
    if (method.name == name) return &method;
  }
  return nullptr;
}

std::size_t weightOf(const InterfaceMethod& method) {
  // A method that answers a dictionary describes one session. Only a list grows with the number of
  // sessions.
  const bool answersList = method.out.starts_with('a') && !method.out.starts_with("a{");
  return answersList ? kListRequestWeight : 1;
}

bool isAnswerUnwanted(const dbus::MessageHeader& header) {
  return (header.flags & dbus::kNoReplyExpected) != 0;
}

ReplyCallback makeReply(const ClientConnection& client, const dbus::MessageHeader& header,
                        const InterfaceMethod& method) {
  if (isAnswerUnwanted(header)) {
    // The object always calls its reply, even if the client has asked for none.
    return [](const std::optional<Error>&, const Value&) {};
  }
  return [ticket = std::make_shared<ReplyTicket>(client.link(), header.serial, method.out)](
             const std::optional<Error>& error, const Value& value) {
    ReplyTicket::answer(ticket, error, value);
  };
}

}  // namespace

struct RequestDispatcher::Request {
  ClientConnection& client;
  const dbus::Frame& frame;
  std::size_t frameBytes;

  [[nodiscard]] const dbus::MessageHeader& header() const { return frame.header; }
  // Returns true if the request is for the object that the client's connection exports.
  [[nodiscard]] bool isForExportedObject() const {
    const NSXPCInterface* exported = client.exportedInterface();
    return exported != nullptr && client.exportedObject() != nullptr &&
           header().path == exported->objectPath;
  }
};

RequestDispatcher::RequestDispatcher(const ConnectionOptions& options,
                                     ConnectionStatistics& statistics,
                                     const ServiceIdentity& identity)
    : options_(options),
      statistics_(statistics),
      standard_(identity, options.counters, options.storage) {
  scratch_.caches = std::make_unique<dbus::DecodeCaches>();
}

void RequestDispatcher::dispatch(ClientConnection& client, const dbus::Frame& frame,
                                 std::size_t frameBytes) {
  const dbus::MessageHeader& header = frame.header;
  // Ignore returns, errors and signals from clients, as D-Bus allows. The service sends no calls to
  // clients, and such messages answer nothing.
  if (header.type != dbus::MessageType::kMethodCall) {
    statistics_.messagesIgnored.add();
    return;
  }
  statistics_.requestsReceived.add();
  client.setLastRequest(header.serial);
  const Request request{.client = client, .frame = frame, .frameBytes = frameBytes};
  if (request.isForExportedObject()) {
    const NSXPCInterface& exported = *client.exportedInterface();
    // D-Bus allows calls without an interface. If several interfaces have a method of that name,
    // the exported interface has precedence over the standard ones.
    if (header.interface.empty() || header.interface == exported.name) {
      const InterfaceMethod* method = findMethod(exported, header.member);
      if (method != nullptr) return deliver(request, *method);
    }
  }
  if (const StandardMethod* method = standard_.find(client, header); method != nullptr) {
    return answerStandard(request, *method);
  }
  refuseUnknown(request);
}

void RequestDispatcher::deliver(const Request& request, const InterfaceMethod& method) {
  // Check rights and limits before decoding the body. A refused request then needs no decoding.
  if (method.access == MethodAccess::kOwner && isForbidden(request, method.name)) return;
  if (method.effect != MethodEffect::kHoldsNoMore && isOverLimits(request, method)) return;
  scratch_.addedEntries = method.addedEntries;
  if (!decode(request, method.in)) return;
  // Check this limit after decoding, because it depends on the arguments.
  if (namesTooManyReporters(request, method)) {
    arguments_.clear();
    return;
  }
  statistics_.requestsDelivered.add();
  ClientConnection& client = request.client;
  const FlowControl::Cost cost{.requests = weightOf(method), .bytes = request.frameBytes};
  if (method.post != nullptr) {
    post(request, method, cost);
    return;
  }
  method.invoke(
      *client.exportedObject(),
      Invocation{.arguments = arguments_,
                 .reply = makeReply(client, request.header(), method),
                 .context = {.sender = client.processIdentifier(),
                             .token = std::make_shared<OpenRequest>(client.link(), cost)}});
  // Release the values of this request now. They must not live until the next request.
  arguments_.clear();
}

void RequestDispatcher::post(const Request& request, const InterfaceMethod& method,
                             FlowControl::Cost cost) {
  const ClientConnection& client = request.client;
  const dbus::MessageHeader& header = request.header();
  client.link()->flow().open(cost);
  method.post(*client.exportedObject(), arguments_,
              PostedRequest(client.link(), {.serial = header.serial,
                                            .wantsAnswer = !isAnswerUnwanted(header),
                                            .signature = method.out,
                                            .weight = cost.requests,
                                            .bytes = cost.bytes}),
              client.processIdentifier());
  arguments_.clear();
}

bool RequestDispatcher::isForbidden(const Request& request, std::string_view method) {
  constexpr uid_t kRoot = 0;
  const uid_t owner = geteuid();
  const uid_t user = request.client.credentials().uid;
  // The user comes from the kernel or from the bus, never from the message. The user is unknown if
  // the bus has not reported it.
  if (user != kUnknownUser && (user == owner || user == kRoot)) return false;
  const std::string who = user == kUnknownUser ? "an unknown user" : "uid " + std::to_string(user);
  request.client.refuse(request.header(), Refusal::kNotAllowed, error_names::kAccessDenied,
                        quoted(method) + ": only root and the service's own user (uid " +
                            std::to_string(owner) + ") may call this; the client is " + who);
  return true;
}

// A client can exceed both bounds a little. The bytes of a request are charged only at its
// delivery, and a client below its bound may still send one request of any size. Sessions are
// counted only once they have been made, and requests that are still open can make a few more.
bool RequestDispatcher::isOverLimits(const Request& request, const InterfaceMethod& method) {
  const ResourceUse use = request.client.exportedObject()->resourceUse();
  const std::uint64_t maxBytes = options_.clientHistoryMegabytes * kMiB;
  if (use.bytes >= maxBytes) {
    request.client.refuse(
        request.header(), Refusal::kHistoryLimit, error_names::kLimitsExceeded,
        "client_history_megabytes = " + std::to_string(options_.clientHistoryMegabytes) +
            " is reached: " + std::to_string(use.bytes) +
            " bytes are held for the client, in its sessions and in messages that wait; stop or"
            " destroy sessions");
    return true;
  }
  if (method.effect == MethodEffect::kMakesSession && use.sessions >= options_.clientSessions) {
    request.client.refuse(request.header(), Refusal::kSessionLimit, error_names::kLimitsExceeded,
                          "client_sessions = " + std::to_string(options_.clientSessions) +
                              " is reached: the client has " + std::to_string(use.sessions) +
                              " sessions; destroy some");
    return true;
  }
  return false;
}

bool RequestDispatcher::namesTooManyReporters(const Request& request,
                                              const InterfaceMethod& method) {
  if (method.reporterIDs == nullptr) return false;
  const std::size_t named = method.reporterIDs(arguments_);
  if (named <= options_.messageReporterIDs) return false;
  request.client.refuse(request.header(), Refusal::kReporterIDLimit, error_names::kLimitsExceeded,
                        "message_reporter_ids = " + std::to_string(options_.messageReporterIDs) +
                            " is exceeded: the message names " + std::to_string(named) +
                            " reporter IDs; send it in several messages");
  return true;
}

void RequestDispatcher::answerStandard(const Request& request, const StandardMethod& method) {
  if (method.access == MethodAccess::kOwner && isForbidden(request, method.name)) return;
  scratch_.addedEntries = 0;
  if (!decode(request, method.in)) return;
  statistics_.requestsAnsweredHere.add();
  const dbus::MessageHeader& header = request.header();
  const StandardAnswer answer = method.answer({.client = request.client,
                                               .path = header.path,
                                               .arguments = arguments_,
                                               .identity = standard_.identity(),
                                               .counters = standard_.counters(),
                                               .storage = standard_.storage()});
  arguments_.clear();
  if (isAnswerUnwanted(header)) return;
  statistics_.repliesGiven.add();
  if (answer.errorName.empty()) {
    request.client.sendReturn(header.serial, method.out, answer.value);
  } else {
    request.client.sendError(header.serial, answer.errorName, answer.errorText);
  }
}

// Returns false if the request was refused or the client has disconnected.
bool RequestDispatcher::decode(const Request& request, std::string_view signature) {
  const dbus::MessageHeader& header = request.header();
  // The service reads the socket without ancillary data, and the kernel has therefore closed the
  // descriptors. Refuse the message, because without the descriptors it is not what its sender
  // meant.
  if (header.unixFds != 0) {
    request.client.refuse(header, Refusal::kUnsupportedValue, error_names::kInvalidArgs,
                          quoted(header.member) + ": the message has " +
                              std::to_string(header.unixFds) +
                              " file descriptors (signature \"h\"), expected none");
    return false;
  }
  const std::optional<dbus::DecodeError> error =
      dbus::decodeBody(request.frame, signature, arguments_, scratch_);
  if (!error.has_value()) return true;
  switch (error->kind) {
    case dbus::DecodeError::Kind::kMalformed:
      request.client.onMalformed(error->message);
      break;
    case dbus::DecodeError::Kind::kUnsupported:
      request.client.refuse(header, Refusal::kUnsupportedValue, error_names::kInvalidArgs,
                            quoted(header.member) + ": " + error->message);
      break;
    case dbus::DecodeError::Kind::kWrongSignature:
      request.client.refuse(header, Refusal::kWrongSignature, error_names::kInvalidArgs,
                            quoted(header.member) + ": " + error->message);
      break;
  }
  return false;
}

void RequestDispatcher::refuseUnknown(const Request& request) {
  const dbus::MessageHeader& header = request.header();
  const NSXPCInterface* exported = request.client.exportedInterface();
  switch (standard_.unknownPartOf(request.client, header)) {
    case UnknownPart::kObject:
      request.client.refuse(
          header, Refusal::kUnknownObject, error_names::kUnknownObject,
          "there is no object at path " + quoted(header.path) +
              (exported == nullptr ? std::string() : ", expected " + quoted(exported->objectPath)));
      break;
    case UnknownPart::kInterface:
      request.client.refuse(header, Refusal::kUnknownInterface, error_names::kUnknownInterface,
                            "the object at path " + quoted(header.path) + " has no interface " +
                                quoted(header.interface));
      break;
    case UnknownPart::kMethod:
      request.client.refuse(
          header, Refusal::kUnknownMethod, error_names::kUnknownMethod,
          (header.interface.empty() ? "the object at path " + quoted(header.path)
                                    : "the interface " + quoted(header.interface)) +
              " has no method " + quoted(header.member));
      break;
  }
}

}  // namespace halvox::platform::linux_
