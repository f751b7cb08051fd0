#include "platform/linux/connection/wire/Signature.h"

#include <array>

namespace halvox::platform::linux_::dbus {
namespace {

// The role of a character in a signature.
enum class Role : std::uint8_t { kNone, kBasic, kDescriptor, kVariant };

constexpr std::array<Role, 256> makeRoles() {
  std::array<Role, 256> roles{};
  for (const char code : std::string_view("ybnqiuxtdsog")) {
    roles[static_cast<unsigned char>(code)] = Role::kBasic;
  }
  roles['h'] = Role::kDescriptor;
  roles['v'] = Role::kVariant;
  return roles;
}
constexpr std::array<Role, 256> kRoles = makeRoles();

Role roleOf(char code) { return kRoles[static_cast<unsigned char>(code)]; }

bool isBasic(char code) { return roleOf(code) == Role::kBasic || code == 'h'; }

// Scans complete types, and notes whether one of them is unsupported. The length of a signature, at
// most kMaxSignatureBytes, bounds the recursion.
class TypeScanner {
 public:
  explicit TypeScanner(std::string_view text) : text_(text) {}

  [[nodiscard]] bool atEnd() const { return position_ == text_.size(); }

  // Returns false if no complete type starts here.
  bool scanType(unsigned arrays, unsigned structs) {
    const char code = next();
    const Role role = roleOf(code);
    // Continue scanning even if the nesting is too deep. If the rest is invalid, the whole
    // signature is invalid, which is the more serious error: it ends the connection.
    if (arrays > kMaxSignatureNesting || structs > kMaxSignatureNesting) tooDeep_ = true;
    if (code == 'a') {
      return peek() == '{' ? scanEntry(arrays + 1, structs + 1) : scanType(arrays + 1, structs);
    }
    if (code == '(') return scanStruct(arrays, structs + 1);
    if (role == Role::kDescriptor) unsupported_ = true;
    return role != Role::kNone;
  }

  [[nodiscard]] SignatureShape shape() const {
    if (tooDeep_) return SignatureShape::kTooDeep;
    return unsupported_ ? SignatureShape::kUnsupported : SignatureShape::kTaken;
  }

 private:
  [[nodiscard]] char peek() const { return atEnd() ? '\0' : text_[position_]; }
  char next() {
    const char code = peek();
    if (!atEnd()) ++position_;
    return code;
  }

  bool scanEntry(unsigned arrays, unsigned structs) {
    ++position_;
    const char key = next();
    if (key != 's') unsupported_ = true;
    return isBasic(key) && scanType(arrays, structs) && next() == '}';
  }

  // A date is the only supported struct.
  bool scanStruct(unsigned arrays, unsigned structs) {
    if (text_.substr(position_, 2) != "d)") unsupported_ = true;
    // Scan at least one member, because D-Bus has no empty structs.
    do {
      if (!scanType(arrays, structs)) return false;
    } while (!atEnd() && peek() != ')');
    return next() == ')';
  }

  std::string_view text_;  // of the caller, which outlives this
  std::size_t position_ = 0;
  bool tooDeep_ = false;
  bool unsupported_ = false;
};

}  // namespace

SignatureShape shapeOfSignature(std::string_view signature) {
  if (signature.size() > kMaxSignatureBytes) return SignatureShape::kBroken;
  TypeScanner scanner(signature);
  while (!scanner.atEnd()) {
    if (!scanner.scanType(0, 0)) return SignatureShape::kBroken;
  }
  return scanner.shape();
}

SignatureShape shapeOfType(std::string_view type) {
  // Most types have one character. They need no scanner.
  if (type.size() == 1 && roleOf(type.front()) == Role::kBasic) return SignatureShape::kTaken;
  if (type.size() > kMaxSignatureBytes) return SignatureShape::kBroken;
  TypeScanner scanner(type);
  if (!scanner.scanType(0, 0) || !scanner.atEnd()) return SignatureShape::kBroken;
  return scanner.shape();
}

bool isSignature(std::string_view signature) {
  const SignatureShape shape = shapeOfSignature(signature);
  return shape == SignatureShape::kTaken || shape == SignatureShape::kUnsupported;
}

std::size_t firstTypeLength(std::string_view signature) {
  std::size_t length = 0;
  while (signature[length] == 'a') ++length;
  unsigned open = 0;
  do {
    const char code = signature[length++];
    if (code == '(' || code == '{') ++open;
    if (code == ')' || code == '}') --open;
  } while (open > 0);
  return length;
}

std::size_t alignmentOf(char typeCode) {
  switch (typeCode) {
    case 'n':
    case 'q':
      return 2;
    case 'b':
    case 'i':
    case 'u':
    case 's':
    case 'o':
    case 'a':
    case 'h':
      return 4;
    case 'x':
    case 't':
    case 'd':
    case '(':
    case '{':
      return 8;
    default:  // y, g, v, and characters that are not types
      return 1;
  }
}

}  // namespace halvox::platform::linux_::dbus
