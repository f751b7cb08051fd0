// Encodes sequences of payloads that resemble each other, as those of clients do. The encoder
// copies what a payload has in common with the one before. The text must be the one that an encoder
// without a past makes, and it must parse.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <rapidjson/document.h>

#include "platform/linux/store/PayloadEncoder.h"

namespace halvox::platform::linux_ {
namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

// The input, from which decisions, numbers and texts are taken. Zeros follow its end.
class Input {
 public:
  explicit Input(std::span<const std::uint8_t> bytes) : bytes_(bytes) {}
  [[nodiscard]] bool empty() const { return bytes_.empty(); }

  std::uint8_t byte() {
    if (bytes_.empty()) return 0;
    const std::uint8_t first = bytes_.front();
    bytes_ = bytes_.subspan(1);
    return first;
  }
  std::size_t below(std::size_t bound) { return byte() % bound; }
  template <typename Number>
  Number number() {
    Number result{};
    std::uint8_t raw[sizeof result];
    for (std::uint8_t& each : raw) each = byte();
    std::memcpy(&result, raw, sizeof result);
    return result;
  }
  std::string text() {
    std::string result(below(40), '\0');
    for (char& each : result) each = static_cast<char>(byte());
    return result;
  }

 private:
  std::span<const std::uint8_t> bytes_;
};

Value makeValue(Input& input, int depth) {
  switch (input.below(depth > 3 ? 9 : 11)) {
    case 0:
      return {};
    case 1:
      return input.byte() % 2 == 0;
    case 2:
      return input.number<std::int16_t>();
    case 3:
      return input.number<std::uint64_t>();
    case 4:
      return input.number<double>();
    case 5:
      return input.number<float>();
    case 6:
      return input.text();
    case 7:
      return Date{input.number<double>()};
    case 8: {
      const std::string text = input.text();
      return Data(std::as_bytes(std::span(text)));
    }
    case 9: {
      std::vector<Value> values(input.below(4));
      for (Value& value : values) value = makeValue(input, depth + 1);
      return Array(values);
    }
    default: {
      Dictionary dictionary;
      for (std::size_t left = input.below(4); left > 0; --left) {
        dictionary.set(input.text(), makeValue(input, depth + 1));
      }
      return dictionary;
    }
  }
}

// Few keys, so that positions often have the same one; one of them is too long to be interned.
Key makeKey(Input& input) {
  static const std::string rareKey(200, 'r');
  const std::size_t choice = input.below(12);
  if (choice == 0) return Key(input.text());
  if (choice == 1) return Key(rareKey);
  return Key(std::string(choice, static_cast<char>('a' + choice)));
}

void change(Input& input, Dictionary& payload) {
  switch (input.below(5)) {
    case 0:
      payload.set(makeKey(input), makeValue(input, 0));
      break;
    case 1:
      if (!payload.empty()) {
        payload.setAt(input.below(payload.size()), makeValue(input, 0));
      }
      break;
    case 2:
      payload.remove(makeKey(input));
      break;
    case 3:
      payload.reserve(payload.size() + 4);
      break;
    default:
      // A payload with equal entries that are not shared.
      Dictionary copy;
      for (const Dictionary::Entry& entry : payload) copy.set(entry.key, entry.value);
      payload = copy;
      break;
  }
}

void check(PayloadEncoder& encoder, const Dictionary& payload, const Dictionary::Entry* added) {
  const std::string text(encoder.encode(payload, added));
  PayloadEncoder fresh;
  require(text == fresh.encode(payload, added));
  rapidjson::Document document;
  document.Parse<rapidjson::kParseValidateEncodingFlag | rapidjson::kParseIterativeFlag>(
      text.data(), text.size());
  require(!document.HasParseError() && document.IsObject());
  require(document.MemberCount() == payload.size() + (added == nullptr ? 0 : 1));
}

}  // namespace
}  // namespace halvox::platform::linux_

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::platform;
  using namespace halvox::platform::linux_;
  Input input({data, size});
  PayloadEncoder encoder;
  Dictionary payload;
  std::optional<Dictionary::Entry> added;
  while (!input.empty()) {
    const std::size_t step = input.below(8);
    if (step == 0) encoder.giveBack();
    if (step == 1) added.emplace(Dictionary::Entry{makeKey(input), makeValue(input, 0)});
    if (step == 2) added.reset();
    if (step >= 3) change(input, payload);
    const bool isAdded = added.has_value() && !payload.contains(added->key.text());
    check(encoder, payload, isAdded ? &*added : nullptr);
  }
  return 0;
}
