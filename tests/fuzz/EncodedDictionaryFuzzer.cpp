// Carries out a random program of changes of dictionaries and arrays in their encoded form, and the
// same changes of ordinary values. The frame of each message must then equal, byte for byte, the
// frame that is encoded from the ordinary values and that of a message that is built anew. The
// service must decode the ordinary values from it.

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include "client/EncodedArray.h"
#include "client/EncodedDictionary.h"
#include "client/RequestEncoder.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "tests/fuzz/InputBytes.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;
using platform::Array;
using platform::NumberKind;
using platform::ValueKind;

// A container can be stored in itself, which doubles its size. Larger containers than this make the
// fuzzer slow and show nothing more.
constexpr std::size_t kMostBytes = 1024;
constexpr std::size_t kSlots = 3;

void require(bool condition) {
  if (!condition) std::abort();
}

// The input as a sequence of numbers and texts; zeros after its end.
class Input : public fuzzing::InputBytes {
 public:
  using InputBytes::InputBytes;

  std::size_t below(std::size_t end) { return byte() % end; }
  template <typename Number>
  Number number() {
    std::array<std::uint8_t, sizeof(Number)> bytes{};
    for (std::uint8_t& each : bytes) each = byte();
    Number number;
    std::memcpy(&number, bytes.data(), sizeof number);
    return number;
  }
  // The texts are few and therefore repeat: a change replaces a value only if its key is already
  // there.
  std::string text() {
    const std::uint8_t length = byte();
    if (length < 128) return std::string(length % 20, static_cast<char>('a' + length % 3));
    std::string made;
    for (std::size_t size = length % 80; size > 0 && !isEmpty(); --size) {
      made += static_cast<char>(byte());
    }
    return made;
  }
};

std::span<const std::byte> bytesOf(const std::string& text) {
  return std::as_bytes(std::span(text));
}

// Reads a value of this type from the input. Calls `put` with it in the form that encoded
// containers take, and returns it in the form that ordinary containers take.
template <typename Put>
Value putScalar(Input& input, std::size_t type, const Put& put) {
  const auto number = [&](auto value) {
    put(value);
    return Value(value);
  };
  switch (type) {
    case 0:
      return number(input.byte() % 2 == 0);
    case 1:
      return number(input.number<std::uint8_t>());
    case 2:
      return number(input.number<std::int16_t>());
    case 3:
      return number(input.number<std::uint16_t>());
    case 4:
      return number(input.number<std::int32_t>());
    case 5:
      return number(input.number<std::uint32_t>());
    case 6:
      return number(input.number<std::int64_t>());
    case 7:
      return number(input.number<std::uint64_t>());
    case 8:
      return number(input.number<float>());
    case 9:
      return number(input.number<double>());
    case 10:
      return number(platform::Date{input.number<double>()});
    default:
      break;
  }
  const std::string bytes = input.text();
  put(bytesOf(bytes));
  return platform::Data(bytesOf(bytes));
}
constexpr std::size_t kScalars = 12;

struct DictionarySlot {
  std::unique_ptr<EncodedDictionary> encoded = std::make_unique<EncodedDictionary>();
  Dictionary value;
};
struct ArraySlot {
  std::unique_ptr<EncodedArray> encoded = std::make_unique<EncodedArray>();
  std::vector<Value> values;
  [[nodiscard]] bool isLarge() const { return encoded->wireForm().atEight.size() > kMostBytes; }
};

// ---- Building a message anew

EncodedArray& fill(EncodedArray& array, const Array& values);

EncodedDictionary& fill(EncodedDictionary& dictionary, const Dictionary& value);

// Calls `put` with the value as the encoded containers take it.
template <typename Put>
void putValue(const Value& value, const Put& put) {
  switch (value.kind()) {
    case ValueKind::kNone:
      return;
    case ValueKind::kString:
      return put(value.string());
    case ValueKind::kDate:
      return put(value.date());
    case ValueKind::kData: {
      const platform::Data data = value.data();
      return put(data.bytes());
    }
    case ValueKind::kArray: {
      EncodedArray array;
      return put(fill(array, value.array()));
    }
    case ValueKind::kDictionary: {
      EncodedDictionary dictionary;
      return put(fill(dictionary, value.dictionary()));
    }
    case ValueKind::kNumber:
      break;
  }
  switch (value.numberKind()) {
    case NumberKind::kBool:
      return put(value.toBool());
    case NumberKind::kUInt8:
      return put(static_cast<std::uint8_t>(value.toUInt64()));
    case NumberKind::kInt16:
      return put(static_cast<std::int16_t>(value.toInt64()));
    case NumberKind::kUInt16:
      return put(static_cast<std::uint16_t>(value.toUInt64()));
    case NumberKind::kInt32:
      return put(static_cast<std::int32_t>(value.toInt64()));
    case NumberKind::kUInt32:
      return put(static_cast<std::uint32_t>(value.toUInt64()));
    case NumberKind::kInt64:
      return put(value.toInt64());
    case NumberKind::kUInt64:
      return put(value.toUInt64());
    case NumberKind::kFloat:
    case NumberKind::kDouble:
      return put(value.toDouble());
  }
}

EncodedArray& fill(EncodedArray& array, const Array& values) {
  for (const Value& value : values) {
    putValue(value, [&](const auto& each) { static_cast<void>(array.append(each)); });
  }
  return array;
}

EncodedDictionary& fill(EncodedDictionary& dictionary, const Dictionary& value) {
  for (const auto& [key, each] : value) {
    const std::string_view text = key.text();
    putValue(each, [&](const auto& given) { require(dictionary.set(text, given)); });
  }
  return dictionary;
}

// ---- The program, and what must hold after it

class Program {
 public:
  explicit Program(Input input) : input_(input) {}

  void run() {
    while (!input_.isEmpty()) {
      const std::uint8_t step = input_.byte();
      DictionarySlot& dictionary = dictionaries_[input_.below(kSlots)];
      if (step < 160) {
        set(dictionary, step % (kScalars + 3));
      } else if (step < 190) {
        const std::string key = input_.text();
        require(dictionary.encoded->remove(key) == dictionary.value.remove(key));
      } else if (step < 250) {
        append(arrays_[input_.below(kSlots)], step % (kScalars + 3));
      } else {
        dictionary = {};
        arrays_[input_.below(kSlots)] = {};
      }
    }
    for (const DictionarySlot& dictionary : dictionaries_) check(dictionary);
  }

 private:
  void set(DictionarySlot& slot, std::size_t type) {
    const std::string key = input_.text();
    const bool isGood = platform::linux_::isUtf8WithoutNul(key);
    const auto put = [&](const auto& value) { require(slot.encoded->set(key, value) == isGood); };
    if (slot.encoded->wireForm().entries.size() > kMostBytes) return;
    Value value;
    if (type < kScalars) {
      value = putScalar(input_, type, put);
    } else if (type == kScalars) {
      const std::string text = input_.text();
      const bool textIsGood = platform::linux_::isUtf8WithoutNul(text);
      require(slot.encoded->set(key, text) == (isGood && textIsGood));
      if (!textIsGood) return;
      value = text;
    } else if (type == kScalars + 1) {
      const DictionarySlot& inner = dictionaries_[input_.below(kSlots)];
      value = inner.value;
      put(*inner.encoded);
    } else {
      const ArraySlot& inner = arrays_[input_.below(kSlots)];
      if (inner.isLarge()) return;
      value = Array(inner.values);
      put(*inner.encoded);
    }
    if (isGood) slot.value.set(key, std::move(value));
  }

  void append(ArraySlot& slot, std::size_t type) {
    const auto put = [&](const auto& value) { slot.encoded->append(value); };
    if (slot.isLarge()) return;
    Value value;
    if (type < kScalars) {
      value = putScalar(input_, type, put);
    } else if (type == kScalars) {
      const std::string text = input_.text();
      const bool isGood = platform::linux_::isUtf8WithoutNul(text);
      require(slot.encoded->append(text) == isGood);
      if (!isGood) return;
      value = text;
    } else if (type == kScalars + 1) {
      const DictionarySlot& inner = dictionaries_[input_.below(kSlots)];
      value = inner.value;
      put(*inner.encoded);
    } else {
      const ArraySlot& inner = arrays_[input_.below(kSlots)];
      value = Array(inner.values);
      put(*inner.encoded);
    }
    slot.values.push_back(std::move(value));
  }

  // The frame of a message, or an empty text if the wire cannot hold it.
  [[nodiscard]] std::string frameOf(const EncodedDictionary& message) const {
    HeapSegments segments;
    SegmentWriter writer(segments);
    const EncodedMessageView view{ids_, message, 4, 18};
    const EncodeOutcome outcome = encodeBody(writer, view);
    if (outcome == EncodeOutcome::kNoWireForm) return {};
    require(outcome == EncodeOutcome::kDone);
    std::string header(kMessageHeaderBytes, '\0');
    putMessageHeader(header.data(), writer.position());
    return header + segments.join(writer.position());
  }

  void check(const DictionarySlot& slot) const {
    require(slot.encoded->size() == slot.value.size());
    std::string frame = frameOf(*slot.encoded);
    const Request expected = makeRequest(MessageView{ids_, slot.value, 4, 18});
    if (frame.empty()) {
      require(std::holds_alternative<Failure>(expected));
      require(!slot.encoded->decode());
      return;
    }
    require(std::holds_alternative<std::string>(expected));
    require(frame == std::get<std::string>(expected));
    require(slot.encoded->decode() == slot.value);
    EncodedDictionary anew;
    require(frame == frameOf(fill(anew, slot.value)));

    setSerial(frame.data(), 1);
    const auto read = dbus::readFrame(std::as_bytes(std::span(frame)));
    require(std::holds_alternative<dbus::Frame>(read));
    std::vector<Value> arguments;
    require(!dbus::decodeBody(std::get<dbus::Frame>(read), "a{sv}uqaax", arguments));
    require(arguments[0] == Value(slot.value));
    require(arguments[3] == Value(Array{Value(Array{7, -8})}));
  }

  Input input_;
  const std::vector<ReporterID> ids_{7, -8};
  std::array<DictionarySlot, kSlots> dictionaries_;
  std::array<ArraySlot, kSlots> arrays_;
};

}  // namespace
}  // namespace halvox::client

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::client;
  Program(Input(std::span(data, size))).run();
  return 0;
}
