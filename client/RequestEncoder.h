#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <variant>

#include "client/EncodedDictionary.h"
#include "client/HalvoxClient.h"
#include "client/SegmentWriter.h"
#include "client/SessionTable.h"

// These functions encode the requests of the service's protocol as frames of the wire. A frame has
// the serial 0 until setSerial(). Numbers keep their type, except that a float becomes a double.
// The elements of an array are encoded as variants.
namespace halvox::client {

// A message, as references to its parts. The caller owns the parts.
template <typename Content>
struct BasicMessageView {
  // The sessions that the message is for; std::nullopt stands for all started ones.
  std::optional<std::span<const ReporterID>> recipients;
  const Content& message;
  Category category = 0;
  EventType type = 0;
};
using MessageView = BasicMessageView<Dictionary>;
using EncodedMessageView = BasicMessageView<EncodedDictionary>;

enum class EncodeOutcome : std::uint8_t {
  kDone,
  kNoRoom,      // the segments are full
  kNoWireForm,  // not UTF-8, an absent value, nested too deep, or too long
};

// Writes the body of sendMessage. Allocates nothing. Unless it returns kDone, the content of the
// segments is undefined.
EncodeOutcome encodeBody(SegmentWriter& writer, const MessageView& message);
EncodeOutcome encodeBody(SegmentWriter& writer, const EncodedMessageView& message);

// The size of the header of sendMessage, which is constant and a multiple of 8. putMessageHeader()
// writes the header for a body of `bodyBytes`.
extern const std::size_t kMessageHeaderBytes;
void putMessageHeader(char* frame, std::size_t bodyBytes);

// A frame, or why the wire cannot hold the request.
using Request = std::variant<std::string, Failure>;

Request makeRequest(const char* member);
Request makeRequest(const char* member, ReporterID id);
Request makeRequest(const SessionOperation& operation);
Request makeRequest(const MessageView& message);
// The request for the service's counters, which has an interface of its own.
Request makeCountersRequest();
// The requests of the service's interface for its store.
Request makeBeginVacuumRequest(const Dictionary& options);
Request makeVacuumStateRequest();
Request makeBeginEraseRequest(const Dictionary& options);
Request makeEraseStateRequest();

// Sets the serial of a frame. It must not be 0. At least the first 12 bytes of the frame must be at
// `frame`.
void setSerial(char* frame, std::uint32_t serial);
// Marks the frame as one that the service must not answer.
void setNoReplyExpected(char* frame);

}  // namespace halvox::client
