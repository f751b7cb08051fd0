#include "platform/linux/tracing/PropertyListShape.h"

#include <algorithm>
#include <vector>

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kTooDeep = "is nested too deeply";
constexpr const char* kTooLarge = "has too many values or too much text";
constexpr const char* kNotXml = "is not an XML property list";
constexpr const char* kHasNul = "contains a text with a NUL byte";
constexpr const char* kNotBinary = "is not a binary property list";

using Reason = const char*;  // null: none

std::size_t quotesIn(std::string_view text) {
  return static_cast<std::size_t>(std::ranges::count(text, '"'));
}

// The library ends the process by an assertion if a key contains a NUL.
bool hasNul(std::string_view text, bool isUtf16) {
  if (!isUtf16) return text.find('\0') != std::string_view::npos;
  for (std::size_t at = 0; at + 1 < text.size(); at += 2) {
    if (text[at] == '\0' && text[at + 1] == '\0') return true;
  }
  return false;
}

bool hasNulInXml(std::string_view text) {
  return hasNul(text, false) || text.find("&#0") != std::string_view::npos ||
         text.find("&#x0") != std::string_view::npos;
}

// Counts the tags of an XML list and compares them with the bounds.
//
// This is not an XML parser and need not be one, because it only has to count at least as much as
// the library will. Anything that the library might read differently is refused, or counted in the
// way that reaches the bounds sooner. Opening tags inside comments count, closing ones do not.
// Quotes in tags must be balanced and contain no bracket. The document type must not have
// declarations of its own.
class XmlShape {
 public:
  XmlShape(std::string_view text, const PropertyListBounds& bounds)
      : text_(text), bounds_(bounds) {}

  Reason check() {
    if (hasNulInXml(text_)) return kHasNul;
    for (;;) {
      const Reason reason = step();
      if (reason != kMore) return reason;
    }
  }

 private:
  static constexpr Reason kMore = "";

  // Moves past the next piece of markup. Returns kMore if there is more to read, null at the end of
  // a valid text, and otherwise the reason to refuse it.
  Reason step() {
    const std::size_t start = text_.find('<');
    if (start == std::string_view::npos) return nullptr;
    text_.remove_prefix(start);
    if (text_.starts_with("<!--")) return skip("-->");
    if (text_.starts_with("<![CDATA[")) return skip("]]>");
    const std::size_t end = text_.find('>');
    if (end == std::string_view::npos) return kNotXml;
    const std::string_view tag = text_.substr(0, end + 1);
    text_.remove_prefix(end + 1);
    if (tag.find('<', 1) != std::string_view::npos || quotesIn(tag) % 2 != 0) return kNotXml;
    if (tag.starts_with("<?")) return tag.ends_with("?>") ? kMore : kNotXml;
    if (tag.starts_with("<!")) return isPlainDocumentType(tag) ? kMore : kNotXml;
    if (tag.starts_with("</")) return close(tag);
    return open(tag);
  }

  static bool isPlainDocumentType(std::string_view tag) {
    return tag.starts_with("<!DOCTYPE") && tag.find('[') == std::string_view::npos;
  }

  Reason skip(std::string_view terminator) {
    const std::size_t end = text_.find(terminator);
    if (end == std::string_view::npos) return kNotXml;
    const std::string_view inside = text_.substr(1, end);
    // If the library ended this comment or text earlier, the rest would be tags.
    elements_ += static_cast<std::uint64_t>(std::ranges::count(inside, '<'));
    text_.remove_prefix(end + terminator.size());
    return elements_ > bounds_.elements ? kTooLarge : kMore;
  }

  Reason open(std::string_view tag) {
    if (++elements_ > bounds_.elements) return kTooLarge;
    if (tag.ends_with("/>")) return kMore;
    const bool holdsOthers =
        tag.starts_with("<array") || tag.starts_with("<dict") || tag.starts_with("<plist");
    if (holdsOthers) ++depth_;
    return depth_ > bounds_.depth + kLevelsAround ? kTooDeep : kMore;
  }

  Reason close(std::string_view tag) {
    const std::string_view name = tag.substr(2, tag.find_first_of(" \t\r\n>") - 2);
    if (name != "array" && name != "dict" && name != "plist") return kMore;
    if (depth_ == 0) return kNotXml;
    --depth_;
    return kMore;
  }

  // The <plist> element, which contains the list and counts as a level here.
  static constexpr std::size_t kLevelsAround = 1;

  std::string_view text_;
  const PropertyListBounds& bounds_;
  std::size_t depth_ = 0;
  std::uint64_t elements_ = 0;
};

// Computes the weight of a binary list: how large it becomes when every use of a shared object is a
// copy. Each object is weighed once, from the root down, with a stack of its own instead of
// recursion.
class BinaryShape {
 public:
  BinaryShape(std::string_view bytes, const PropertyListBounds& bounds)
      : bytes_(bytes), bounds_(bounds) {}

  Reason check() {
    if (const Reason reason = readTrailer()) return reason;
    weights_.resize(objects_);
    if (const Reason reason = push(root_)) return reason;
    while (!open_.empty()) {
      if (const Reason reason = step()) return reason;
    }
    return nullptr;
  }

 private:
  struct Weight {
    enum class State : std::uint8_t { kNew, kOpen, kDone };
    State state = State::kNew;
    std::uint8_t depth = 0;
    std::uint64_t elements = 1;
    std::uint64_t bytes = 0;
  };
  // The content of an object: payload bytes, or references to other objects.
  struct Object {
    std::uint64_t bytes = 0;
    std::uint64_t references = 0;
    std::size_t first = 0;  // position of the first reference
  };
  struct Level {
    std::uint64_t object = 0;
    std::uint64_t next = 0;
    Object content{};
  };

  // The last 32 bytes describe the rest. Every number in them is from outside and is compared with
  // the size of the file before it is used. The subtraction and the division cannot overflow.
  Reason readTrailer() {
    constexpr std::size_t kHeader = 8;
    constexpr std::size_t kTrailer = 32;
    constexpr std::size_t kSizes = 6;
    if (bytes_.size() < kHeader + kTrailer) return kNotBinary;
    const std::size_t trailer = bytes_.size() - kTrailer;
    offsetSize_ = number(trailer + kSizes, 1);
    referenceSize_ = number(trailer + kSizes + 1, 1);
    objects_ = number(trailer + 8, 8);
    root_ = number(trailer + 16, 8);
    offsets_ = number(trailer + 24, 8);
    const bool isSane = offsetSize_ >= 1 && offsetSize_ <= 8 && referenceSize_ >= 1 &&
                        referenceSize_ <= 8 && offsets_ < trailer && root_ < objects_ &&
                        objects_ <= (trailer - offsets_) / offsetSize_;
    if (!isSane) return kNotBinary;
    return objects_ > bounds_.elements ? kTooLarge : nullptr;
  }

  Reason push(std::uint64_t object) {
    weights_[object].state = Weight::State::kOpen;
    open_.push_back({.object = object});
    const Reason reason = read(object, open_.back().content);
    weights_[object].bytes = open_.back().content.bytes;
    return reason;
  }

  Reason step() {
    Level& level = open_.back();
    if (level.next == level.content.references) {
      weights_[level.object].state = Weight::State::kDone;
      open_.pop_back();
      return nullptr;
    }
    const std::size_t at = level.content.first + level.next * referenceSize_;
    const std::uint64_t child = number(at, referenceSize_);
    if (child >= objects_) return kNotBinary;
    switch (weights_[child].state) {
      case Weight::State::kNew:
        // Check the depth before reading the child. Otherwise a deeply nested list would make the
        // stack grow without limit.
        if (open_.size() > bounds_.depth) return kTooDeep;
        return push(child);  // and continues here when the child is done
      case Weight::State::kOpen:
        return "contains itself";
      case Weight::State::kDone:
        ++level.next;
        return take(weights_[level.object], weights_[child]);
    }
    return nullptr;
  }

  Reason take(Weight& parent, const Weight& child) const {
    parent.depth = static_cast<std::uint8_t>(std::max<int>(parent.depth, child.depth + 1));
    // Add the weight of a shared object for each of its uses, because the library makes a copy for
    // each use.
    parent.elements += child.elements;
    parent.bytes += child.bytes;
    if (parent.depth > bounds_.depth) return kTooDeep;
    const bool isTooLarge = parent.elements > bounds_.elements || parent.bytes > bounds_.bytes;
    return isTooLarge ? kTooLarge : nullptr;
  }

  // Fills in the content of an object. The library checks whether the object itself is valid.
  Reason read(std::uint64_t object, Object& content) const {
    enum : std::uint8_t { kData = 4, kAscii = 5, kUtf16 = 6, kArray = 10, kDictionary = 13 };
    std::size_t at = number(offsets_ + object * offsetSize_, offsetSize_);
    if (at >= offsets_) return kNotBinary;
    const auto marker = static_cast<unsigned char>(bytes_[at++]);
    const unsigned kind = marker >> 4U;
    if (kind != kData && kind != kAscii && kind != kUtf16 && kind != kArray &&
        kind != kDictionary) {
      return nullptr;
    }
    std::uint64_t count = marker & 0x0FU;
    if (count == 0x0F && !readCount(at, count)) return kNotBinary;
    // Bounds the multiplications below: the count is at most the size of the file.
    if (count > bytes_.size()) return kNotBinary;
    const bool isContainer = kind == kArray || kind == kDictionary;
    const std::uint64_t parts = kind == kUtf16 || kind == kDictionary ? count * 2 : count;
    const std::uint64_t size = isContainer ? parts * referenceSize_ : parts;
    if (size > bytes_.size() - at) return kNotBinary;
    if (!isContainer && kind != kData && hasNul(bytes_.substr(at, size), kind == kUtf16)) {
      return kHasNul;
    }
    content = {.bytes = size, .references = isContainer ? parts : 0, .first = at};
    return nullptr;
  }

  // A count of 15 or more is an integer after the marker.
  bool readCount(std::size_t& at, std::uint64_t& count) const {
    if (at >= bytes_.size()) return false;
    const auto marker = static_cast<unsigned char>(bytes_[at++]);
    const std::size_t size = std::size_t{1} << (marker & 0x0FU);
    if (marker >> 4U != 1 || size > 8 || size > bytes_.size() - at) return false;
    count = number(at, size);
    at += size;
    return true;
  }

  // Reads a number whose most significant byte comes first. The caller has checked that the bytes
  // exist.
  [[nodiscard]] std::uint64_t number(std::size_t at, std::size_t size) const {
    std::uint64_t result = 0;
    for (const char byte : bytes_.substr(at, size)) {
      result = (result << 8U) | static_cast<unsigned char>(byte);
    }
    return result;
  }

  const std::string_view bytes_;
  const PropertyListBounds& bounds_;
  std::size_t offsetSize_ = 0;
  std::size_t referenceSize_ = 0;
  std::size_t offsets_ = 0;
  std::uint64_t objects_ = 0;
  std::uint64_t root_ = 0;
  std::vector<Weight> weights_;
  std::vector<Level> open_;
};

}  // namespace

bool isBinaryPropertyList(std::string_view bytes) { return bytes.starts_with("bplist"); }

std::optional<std::string> whyUnreadable(std::string_view bytes, const PropertyListBounds& bounds) {
  const Reason reason = isBinaryPropertyList(bytes) ? BinaryShape(bytes, bounds).check()
                                                    : XmlShape(bytes, bounds).check();
  if (reason == nullptr) return std::nullopt;
  return reason;
}

}  // namespace halvox::platform::linux_
