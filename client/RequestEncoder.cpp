#include "client/RequestEncoder.h"

#include <array>
#include <bit>
#include <cstring>
#include <string_view>
#include <utility>

#include "client/Overloaded.h"
#include "client/ValueWriter.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/HeaderFields.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;
using dbus::HeaderField;

constexpr std::string_view kObjectPath = "/com/tarno/halvox/reporting";
constexpr std::string_view kInterface = "com.tarno.halvox.HVReportingServiceProtocol";
constexpr std::string_view kStatisticsInterface = "com.tarno.halvox.Statistics";
constexpr std::string_view kStorageInterface = "com.tarno.halvox.Storage";

// ---- Headers

// A header without its serial and the length of the body. These bytes are the same for every call
// of a method.
struct Header {
  std::array<char, 192> bytes{};
  std::size_t size = 0;

  constexpr void byte(char value) { bytes[size++] = value; }
  constexpr void align() { size = (size + 7) & ~std::size_t{7}; }
  constexpr void put(std::size_t at, std::uint32_t number) {
    for (unsigned index = 0; index < sizeof number; ++index) {
      const unsigned shift = std::endian::native == std::endian::little ? index : 3 - index;
      bytes[at + index] = static_cast<char>(number >> (8 * shift));
    }
  }
  constexpr void characters(std::string_view text) {
    for (const char character : text) byte(character);
    byte('\0');
  }
  constexpr void field(HeaderField code, char type, std::string_view text) {
    align();
    byte(static_cast<char>(code));
    byte(1);
    byte(type);
    byte('\0');
    put(size, static_cast<std::uint32_t>(text.size()));
    size += sizeof(std::uint32_t);
    characters(text);
  }
  constexpr void signature(std::string_view text) {
    align();
    byte(static_cast<char>(HeaderField::kSignature));
    byte(1);
    byte('g');
    byte('\0');
    byte(static_cast<char>(text.size()));
    characters(text);
  }
};

constexpr Header makeHeader(std::string_view member, std::string_view signature,
                            std::string_view interface = kInterface) {
  Header header;
  header.byte(std::endian::native == std::endian::little ? 'l' : 'B');
  header.byte(static_cast<char>(dbus::MessageType::kMethodCall));
  header.byte('\0');
  header.byte(static_cast<char>(dbus::kProtocolVersion));
  header.size = dbus::kFrameStartBytes;
  header.field(HeaderField::kPath, 'o', kObjectPath);
  header.field(HeaderField::kInterface, 's', interface);
  header.field(HeaderField::kMember, 's', member);
  if (!signature.empty()) header.signature(signature);
  header.put(dbus::kFieldsLengthOffset,
             static_cast<std::uint32_t>(header.size - dbus::kFrameStartBytes));
  header.align();
  return header;
}

constexpr Header kSendMessage = makeHeader("sendMessage", "a{sv}uqaax");

// Appends the header and the body, then sets the length of the body in the header.
template <typename Body>
void writeFrame(SegmentWriter& writer, const Header& header, const Body& body) {
  char* length = nullptr;
  if (char* const at = writer.reserve(header.size); at != nullptr) {
    std::memcpy(at, header.bytes.data(), header.size);
    length = at + dbus::kBodyLengthOffset;
    writer.commit(at + header.size);
  } else {
    writer.bytes(header.bytes.data(), dbus::kBodyLengthOffset);
    length = writer.length();
    const std::size_t rest = dbus::kSerialOffset;
    writer.bytes(header.bytes.data() + rest, header.size - rest);
  }
  const std::size_t start = writer.position();
  body();
  SegmentWriter::replaceLength(length, writer.position() - start);
}

// ---- Requests

[[gnu::hot]] void appendRecipients(SegmentWriter& writer,
                                   const std::optional<std::span<const ReporterID>>& recipients) {
  char* const outer = writer.length();
  const std::size_t start = writer.position();
  if (recipients) {
    char* const inner = writer.length();
    writer.align(8);
    const std::size_t first = writer.position();
    writer.bytes(recipients->data(), recipients->size_bytes());
    SegmentWriter::replaceLength(inner, writer.position() - first);
  }
  SegmentWriter::replaceLength(outer, writer.position() - start);
}

template <typename Content>
void appendEnd(SegmentWriter& writer, const BasicMessageView<Content>& message) {
  writer.number(message.category);
  writer.number(message.type);
  appendRecipients(writer, message.recipients);
}

bool appendBody(SegmentWriter& writer, ValueWriter& values, const MessageView& message) {
  if (!values.append(message.message)) return false;
  appendEnd(writer, message);
  return true;
}

EncodeOutcome outcomeOf(const SegmentWriter& writer, bool hasForm) {
  if (writer.isFull()) return EncodeOutcome::kNoRoom;
  const bool fits = kMessageHeaderBytes + writer.position() <= dbus::kMaxMessageBytes;
  return hasForm && fits ? EncodeOutcome::kDone : EncodeOutcome::kNoWireForm;
}

Failure badRequest(std::string message) {
  return {Failure::Kind::kBadRequest, "", std::move(message)};
}

Request finish(const SegmentWriter& writer, const HeapSegments& segments) {
  if (writer.position() > dbus::kMaxMessageBytes) {
    return badRequest("the request is longer than 128 MiB, the limit of D-Bus");
  }
  return segments.join(writer.position());
}

template <typename Body>
Request make(const Header& header, const Body& body) {
  HeapSegments segments;
  SegmentWriter writer(segments);
  writeFrame(writer, header, [&] { body(writer); });
  return finish(writer, segments);
}

// Makes a request whose body is a dictionary and what `appendRest` adds.
template <typename Rest>
Request makeWithDictionary(const Header& header, const Dictionary& dictionary,
                           const Rest& appendRest) {
  std::string path;
  std::optional<std::string> error;
  Request request = make(header, [&](SegmentWriter& writer) {
    ValueWriter values(writer, &path);
    if (!values.append(dictionary)) error = values.error();
    appendRest(writer);
  });
  if (error) return badRequest(*error);
  return request;
}

Request makeSetConfiguration(ReporterID id, const Dictionary& configuration) {
  return makeWithDictionary(makeHeader("setConfiguration", "a{sv}x"), configuration,
                            [id](SegmentWriter& writer) { writer.number(id); });
}

Request makeSetServiceType(ReporterID id, ServiceType type) {
  return make(makeHeader("setServiceType", "qx"), [&](SegmentWriter& writer) {
    writer.number(type);
    writer.number(id);
  });
}

}  // namespace

const std::size_t kMessageHeaderBytes = kSendMessage.size;

void putMessageHeader(char* frame, std::size_t bodyBytes) {
  std::memcpy(frame, kSendMessage.bytes.data(), kSendMessage.size);
  SegmentWriter::replaceLength(frame + dbus::kBodyLengthOffset, bodyBytes);
}

EncodeOutcome encodeBody(SegmentWriter& writer, const MessageView& message) {
  ValueWriter values(writer);
  const bool hasForm = appendBody(writer, values, message);
  return outcomeOf(writer, hasForm);
}

[[gnu::hot]] EncodeOutcome encodeBody(SegmentWriter& writer, const EncodedMessageView& message) {
  const WireDictionary content = message.message.wireForm();
  const std::size_t bytes = content.entries.size();
  if (1 + content.levels > dbus::kMaxNesting || bytes > dbus::kMaxArrayBytes) {
    return EncodeOutcome::kNoWireForm;
  }
  writer.number(static_cast<std::uint32_t>(bytes));
  writer.align(8);
  writer.bytes(content.entries.data(), bytes);
  appendEnd(writer, message);
  return outcomeOf(writer, true);
}

Request makeRequest(const MessageView& message) {
  std::string path;
  HeapSegments segments;
  SegmentWriter writer(segments);
  ValueWriter values(writer, &path);
  bool hasForm = true;
  writeFrame(writer, kSendMessage, [&] { hasForm = appendBody(writer, values, message); });
  if (!hasForm) return badRequest(values.error());
  return finish(writer, segments);
}

Request makeRequest(const char* member) {
  return make(makeHeader(member, ""), [](SegmentWriter&) {});
}

Request makeCountersRequest() {
  return make(makeHeader("GetCounters", "", kStatisticsInterface), [](SegmentWriter&) {});
}

Request makeBeginVacuumRequest(const Dictionary& options) {
  return makeWithDictionary(makeHeader("BeginVacuum", "a{sv}", kStorageInterface), options,
                            [](SegmentWriter&) {});
}

Request makeVacuumStateRequest() {
  return make(makeHeader("GetVacuum", "", kStorageInterface), [](SegmentWriter&) {});
}

Request makeBeginEraseRequest(const Dictionary& options) {
  return makeWithDictionary(makeHeader("BeginErase", "a{sv}", kStorageInterface), options,
                            [](SegmentWriter&) {});
}

Request makeEraseStateRequest() {
  return make(makeHeader("GetErase", "", kStorageInterface), [](SegmentWriter&) {});
}

Request makeRequest(const char* member, ReporterID id) {
  return make(makeHeader(member, "x"), [id](SegmentWriter& writer) { writer.number(id); });
}

Request makeRequest(const SessionOperation& operation) {
  const ReporterID id = operation.id;
  return std::visit(
      Overloaded{
          [&](const CreateSession&) { return makeRequest("createReportingSession", id); },
          [&](ServiceType type) { return makeSetServiceType(id, type); },
          [&](const Dictionary& configuration) { return makeSetConfiguration(id, configuration); },
          [&](const StartSession&) { return makeRequest("startReportingSessionForID", id); },
          [&](const StopSession&) { return makeRequest("stopReportingSessionForID", id); },
          [&](const DestroySession&) { return makeRequest("destroyReportingSession", id); },
      },
      operation.step);
}

void setSerial(char* frame, std::uint32_t serial) {
  std::memcpy(frame + dbus::kSerialOffset, &serial, sizeof serial);
}

void setNoReplyExpected(char* frame) {
  frame[dbus::kFlagsOffset] = static_cast<char>(dbus::kNoReplyExpected);
}

}  // namespace halvox::client
