#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <variant>

#include "client/HalvoxClient.h"
#include "client/SegmentWriter.h"
#include "client/SessionTable.h"

// The requests of the service's protocol as frames of the wire. A frame has the serial 0 until
// setSerial(). Numbers keep their type; a float is a double, an array has variants as elements.
namespace halvox::client {

// A message, as the caller has it. Nothing is owned.
struct MessageView {
  // The sessions that it is for; nothing stands for all active ones.
  std::optional<std::span<const ReporterID>> recipients;
  const Dictionary& message;
  Category category = 0;
  EventType type = 0;
};

enum class EncodeOutcome : std::uint8_t {
  kDone,
  kNoRoom,      // the segments are full
  kNoWireForm,  // a text is not UTF-8, there is no value, too deep or too long
};

// Writes the frame of sendMessage. Allocates nothing. After any outcome but kDone the segments hold
// nothing of use.
EncodeOutcome encodeMessage(SegmentWriter& writer, const MessageView& message);

// A frame, or why the wire cannot hold the request.
using Request = std::variant<std::string, Failure>;

Request makeRequest(const char* member);
Request makeRequest(const char* member, ReporterID id);
Request makeRequest(const SessionOperation& operation);
Request makeRequest(const MessageView& message);

// Numbers a complete frame, of which at least the first 12 bytes are at `frame`. Not 0.
void setSerial(char* frame, std::uint32_t serial);
// Asks the service not to answer this frame.
void setNoReplyExpected(char* frame);

}  // namespace halvox::client
