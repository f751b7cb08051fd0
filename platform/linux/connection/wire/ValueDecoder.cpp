#include "platform/linux/connection/wire/ValueDecoder.h"

#include <span>

#include "platform/linux/connection/wire/DecodePath.h"
#include "platform/linux/connection/wire/Signature.h"
#include "platform/linux/connection/wire/WireReader.h"

namespace halvox::platform::linux_::dbus {
namespace {

using Kind = DecodeError::Kind;

// The scratch keeps memory for this many elements between messages: more than the open containers
// of an ordinary message have together. With a smaller bound, ordinary messages would allocate the
// scratch each time. Without a bound, the memory for the largest message would stay allocated until
// the service ends.
constexpr std::size_t kKeptElements = 1024;
// Texts of at most this length are stored in the block of memory of their dictionary. Each copy of
// such a value copies the text, while the copies of a longer one share it.
constexpr std::size_t kMostBytesInDictionary = 128;

// Decodes the values of one body. In all functions, `type` is one valid, complete type, because the
// signatures of frames and variants are checked before they are used. `level` is the number of
// containers around a value.
class Decoder {
 public:
  Decoder(const Frame& frame, DecodeScratch& scratch)
      : reader_(frame.body, frame.header.bigEndian), scratch_(scratch) {}

  bool decodeArguments(std::string_view types, std::vector<Value>& arguments);
  [[nodiscard]] DecodeError error() const;

 private:
  [[nodiscard]] bool takeKnownTail(const TailCache::Source& tail, std::vector<Value>& arguments);
  Value decode(std::string_view type, unsigned level);
  Value decodeContainer(std::string_view type, unsigned level);
  Value decodeBoolean(std::string_view type);
  Value decodeDate(std::string_view type);
  Value decodeVariant(unsigned level);
  Value decodeLentText(std::string_view type);
  Value decodeData();
  Value decodeArray(std::string_view type, unsigned level);
  Value decodeDictionary(std::string_view type, unsigned level);
  Dictionary takeEntries(std::size_t first, unsigned level);
  void decodeEntry(std::string_view type, unsigned level);
  [[nodiscard]] bool decodeKnownEntry(unsigned level);
  [[nodiscard]] bool usesKeyCache(std::string_view type, unsigned level) const {
    return level == 1 && scratch_.caches != nullptr && type == "a{sv}" && reader_.isHostOrder();
  }

  template <typename Number>
  Value decodeNumber(std::string_view type) {
    Number number{};
    return reader_.read(number) ? Value(number) : malformed(type);
  }
  template <typename Read>
  Value decodeText(std::string_view type, Read read) {
    std::string_view text;
    return (reader_.*read)(text) ? Value(text) : malformed(type);
  }

  // Stores the error, and returns the absent value.
  Value refuse(Kind kind, std::string_view problem, std::string_view signature) {
    failed_ = true;
    kind_ = kind;
    problem_ = problem;
    signature_ = signature;
    return {};
  }
  Value malformed(std::string_view signature) {
    return refuse(Kind::kMalformed, reader_.problem(), signature);
  }

  WireReader reader_;
  DecodeScratch& scratch_;  // of the caller
  // False if the current argument is a dictionary that may have a key twice. Used only for
  // dictionaries that use the key cache. These are arguments and never inside each other, and one
  // variable is enough.
  bool hasDistinctKeys_ = false;
  // These members describe the error. `path_` is the place of the error: after a failure, each
  // enclosing container adds its own step when its decoding function returns.
  bool failed_ = false;
  Kind kind_ = Kind::kMalformed;
  std::string_view problem_;
  std::string_view signature_;
  DecodePath path_;
};

bool Decoder::decodeArguments(std::string_view types, std::vector<Value>& arguments) {
  std::optional<TailCache::Source> tail;
  for (std::string_view rest = types; !rest.empty();) {
    // Use the cache only for the arguments after a dictionary. Other requests are too small to gain
    // from it.
    if (scratch_.caches != nullptr && arguments.size() == 1 && arguments.front().isDictionary()) {
      tail = {rest, reader_.rest(), reader_.position(), !reader_.isHostOrder()};
      if (takeKnownTail(*tail, arguments)) return true;
    }
    const std::string_view type = rest.substr(0, firstTypeLength(rest));
    arguments.push_back(decode(type, 0));
    if (failed_) {
      path_.setArgument(arguments.size());
      return false;
    }
    rest.remove_prefix(type.size());
  }
  // The header has the length of the body and the signature of its content. If bytes remain, the
  // two disagree, and nothing that was decoded can be trusted.
  if (!reader_.atLimit()) {
    refuse(Kind::kMalformed, "there are bytes after the last argument", types);
  } else if (tail.has_value()) {
    scratch_.caches->tails.note(*tail, arguments.data() + 1, arguments.data() + arguments.size());
  }
  return !failed_;
}

bool Decoder::takeKnownTail(const TailCache::Source& tail, std::vector<Value>& arguments) {
  const std::vector<Value>* const known = scratch_.caches->tails.find(tail);
  if (known == nullptr) return false;
  arguments.insert(arguments.end(), known->begin(), known->end());
  return true;
}

Value Decoder::decode(std::string_view type, unsigned level) {
  switch (type.front()) {
    case 'y':
      return decodeNumber<std::uint8_t>(type);
    case 'n':
      return decodeNumber<std::int16_t>(type);
    case 'q':
      return decodeNumber<std::uint16_t>(type);
    case 'i':
      return decodeNumber<std::int32_t>(type);
    case 'u':
      return decodeNumber<std::uint32_t>(type);
    case 'x':
      return decodeNumber<std::int64_t>(type);
    case 't':
      return decodeNumber<std::uint64_t>(type);
    case 'd':
      return decodeNumber<double>(type);
    case 'b':
      return decodeBoolean(type);
    case 's':
      return decodeText(type, &WireReader::readText);
    case 'o':
      return decodeText(type, &WireReader::readPath);
    case 'g':
      return decodeText(type, &WireReader::readSignature);
    // Only containers have a level of their own, because D-Bus counts only the levels of
    // containers.
    default:
      return decodeContainer(type, level + 1);
  }
}

Value Decoder::decodeContainer(std::string_view type, unsigned level) {
  if (level > kMaxNesting) {
    return refuse(Kind::kUnsupported,
                  "containers nested more than 64 levels deep are not supported", type);
  }
  if (type.front() == 'v') return decodeVariant(level);
  // Test for data before testing for an array. D-Bus has no other type for data than an array of
  // bytes, and the bytes are copied as a block.
  if (type == "ay") return decodeData();
  if (type.starts_with("a{s")) return decodeDictionary(type, level);
  // Dictionaries with other keys are valid on the wire, but a Dictionary of this system has only
  // texts as keys.
  if (type.front() == 'a' && type[1] != '{') return decodeArray(type, level);
  if (type == "(d)") return decodeDate(type);
  return refuse(Kind::kUnsupported, "values of this type are not supported", type);
}

Value Decoder::decodeBoolean(std::string_view type) {
  bool boolean = false;
  return reader_.readBoolean(boolean) ? Value(boolean) : malformed(type);
}

Value Decoder::decodeDate(std::string_view type) {
  Date date;
  // A struct begins at a multiple of 8 bytes, whatever its first member is.
  return reader_.align(8) && reader_.read(date.secondsSince1970) ? Value(date) : malformed(type);
}

Value Decoder::decodeVariant(unsigned level) {
  std::string_view type;
  if (!reader_.readVariantSignature(type)) return malformed("v");
  // Check the type here. The signature of the frame has only `v`, the sender chooses the type in
  // the variant for each value, and decode() relies on a valid type.
  switch (shapeOfType(type)) {
    case SignatureShape::kTaken:
      return decode(type, level);
    case SignatureShape::kUnsupported:
      return refuse(Kind::kUnsupported, "values of this type are not supported", type);
    case SignatureShape::kTooDeep:
      return refuse(Kind::kUnsupported, "the type is nested too deeply to be supported", type);
    case SignatureShape::kBroken:
      break;
  }
  return refuse(Kind::kMalformed, "the signature of a variant is invalid", type);
}

// Decodes a text that takeEntries() will copy into its dictionary, before the frame is released.
Value Decoder::decodeLentText(std::string_view type) {
  std::string_view text;
  if (!reader_.readText(text)) return malformed(type);
  return text.size() <= kMostBytesInDictionary ? Value::lending(text) : Value(text);
}

Value Decoder::decodeData() {
  std::size_t outerLimit = 0;
  if (!reader_.enterArray(1, outerLimit)) return malformed("ay");
  Data data(reader_.takeRest());
  reader_.leaveArray(outerLimit);
  return data;
}

Value Decoder::decodeArray(std::string_view type, unsigned level) {
  const std::string_view elementType = type.substr(1);
  std::size_t outerLimit = 0;
  if (!reader_.enterArray(alignmentOf(elementType.front()), outerLimit)) return malformed(type);
  const std::size_t first = scratch_.values.size();
  for (std::size_t element = 0; !reader_.atLimit(); ++element) {
    // The elements of this array are consecutive in the scratch, because an inner array removes its
    // own elements from there when it is complete.
    scratch_.values.push_back(decode(elementType, level));
    if (failed_) {
      path_.putBefore(element);
      return {};
    }
  }
  reader_.leaveArray(outerLimit);
  Array array(std::span<const Value>(scratch_.values).subspan(first));
  scratch_.values.resize(first);
  return array;
}

Value Decoder::decodeDictionary(std::string_view type, unsigned level) {
  std::size_t outerLimit = 0;
  if (!reader_.enterArray(8, outerLimit)) return malformed(type);
  const std::size_t first = scratch_.entries.size();
  const bool usesKeyCache = this->usesKeyCache(type, level);
  if (usesKeyCache) scratch_.caches->keys.beginDictionary();
  if (level == 1) hasDistinctKeys_ = usesKeyCache;
  while (!failed_ && !reader_.atLimit()) {
    if (!usesKeyCache || !decodeKnownEntry(level)) decodeEntry(type, level);
  }
  // decodeBody() clears the scratch after an error and after a success.
  if (failed_) return {};
  reader_.leaveArray(outerLimit);
  return takeEntries(first, level);
}

Dictionary Decoder::takeEntries(std::size_t first, unsigned level) {
  std::vector<Dictionary::Entry>& scratch = scratch_.entries;
  const std::span<Dictionary::Entry> entries = std::span(scratch).subspan(first);
  Dictionary dictionary;
  if (level == 1 && hasDistinctKeys_) {
    dictionary = Dictionary(entries, scratch_.addedEntries);
  } else if (!entries.empty()) {
    // If keys occur twice, this reserves too much memory, which does no other harm.
    dictionary.reserve(entries.size() + (level == 1 ? scratch_.addedEntries : 0));
    for (Dictionary::Entry& entry : entries) dictionary.set(entry.key, std::move(entry.value));
  }
  scratch.erase(scratch.begin() + static_cast<std::ptrdiff_t>(first), scratch.end());
  return dictionary;
}

// Decodes an entry whose key and type are in the key cache. Returns false if they are not.
bool Decoder::decodeKnownEntry(unsigned level) {
  if (!reader_.align(8)) return false;  // decodeEntry() fails in the same way
  const KeyCache::Head head = scratch_.caches->keys.find(reader_.rest());
  if (head.key == nullptr) return false;
  const std::string_view type = reader_.rest().substr(head.bytes - 2, 1);
  if (head.isRepeated) hasDistinctKeys_ = false;
  reader_.skip(head.bytes);
  Value value = type == "s" ? decodeLentText(type) : decode(type, level);
  if (failed_) {
    path_.putBefore(head.key->text());
  } else {
    scratch_.entries.push_back({*head.key, std::move(value)});
  }
  return true;
}

void Decoder::decodeEntry(std::string_view type, unsigned level) {
  // In a{s…}, the type of the values is between the key's type and the closing brace.
  const std::string_view valueType = type.substr(3, type.size() - 4);
  std::string_view text;
  if (!reader_.align(8)) {
    malformed(type);
    return;
  }
  const std::string_view head = reader_.rest();
  if (!reader_.readText(text)) {
    malformed(type);
    return;
  }
  Value value = decode(valueType, level);
  if (failed_) {
    path_.putBefore(text);
    return;
  }
  const Key key(text);
  if (usesKeyCache(type, level)) {
    scratch_.caches->keys.note(head, key);
    // This dictionary may have had the key before, in an entry that the cache did not store.
    hasDistinctKeys_ = false;
  }
  scratch_.entries.push_back({key, std::move(value)});
}

DecodeError Decoder::error() const {
  DecodeError error;
  error.kind = kind_;
  error.key = path_.text();
  error.signature = quotable(signature_);
  error.message = error.key + (error.key.empty() ? "" : ": ");
  error.message += problem_;
  error.message += " (signature \"" + error.signature + "\"";
  // The path is enough to find an unsupported value. If bytes are broken, their position may be all
  // that is known.
  if (kind_ == Kind::kMalformed) {
    error.message += ", byte " + std::to_string(reader_.position()) + " of the body";
  }
  error.message += ")";
  return error;
}

DecodeError wrongSignature(std::string_view found, std::string_view expected) {
  DecodeError error{Kind::kWrongSignature, {}, std::string(found), {}};
  error.message = "the arguments have the signature \"" + error.signature + "\", expected \"";
  error.message += expected;
  error.message += '"';
  return error;
}

}  // namespace

void DecodeScratch::clear() {
  values.clear();
  entries.clear();
  if (values.capacity() > kKeptElements) values.shrink_to_fit();
  if (entries.capacity() > kKeptElements) entries.shrink_to_fit();
}

std::optional<DecodeError> decodeBody(const Frame& frame, std::string_view expectedSignature,
                                      std::vector<Value>& arguments) {
  DecodeScratch scratch;
  return decodeBody(frame, expectedSignature, arguments, scratch);
}

std::optional<DecodeError> decodeBody(const Frame& frame, std::string_view expectedSignature,
                                      std::vector<Value>& arguments, DecodeScratch& scratch) {
  arguments.clear();
  // Compare the signatures before reading the body. A client that sends wrong arguments then gets
  // an error and stays connected.
  if (frame.header.signature != expectedSignature) {
    return wrongSignature(frame.header.signature, expectedSignature);
  }
  Decoder decoder(frame, scratch);
  std::optional<DecodeError> error;
  if (!decoder.decodeArguments(expectedSignature, arguments)) {
    error = decoder.error();
    arguments.clear();
  }
  // Release the values after an error, too. The values of a refused message must not live until the
  // next message.
  scratch.clear();
  return error;
}

}  // namespace halvox::platform::linux_::dbus
