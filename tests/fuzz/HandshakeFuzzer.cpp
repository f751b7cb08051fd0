// Feeds hostile bytes to the handshake, on either side. The first byte selects the side and the
// size of the pieces in which the other bytes arrive.

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>
#include <vector>

#include "platform/linux/connection/wire/Handshake.h"

namespace halvox::platform::linux_::dbus {
namespace {

constexpr uid_t kUid = 1000;

void require(bool condition) {
  if (!condition) std::abort();
}

struct Conversation {
  HandshakeState state = HandshakeState::kContinue;
  std::size_t consumed = 0;
  std::string output;
};

template <typename Side>
Conversation converse(Side side, std::span<const std::byte> input, std::size_t pieceSize) {
  Conversation result;
  while (result.state == HandshakeState::kContinue && result.consumed < input.size()) {
    const auto rest = input.subspan(result.consumed);
    const auto piece = rest.first(std::min(pieceSize, rest.size()));
    const HandshakeProgress progress = side.feed(piece, result.output);
    require(progress.consumedBytes <= piece.size());
    require(progress.consumedBytes == piece.size() || progress.state != HandshakeState::kContinue);
    require((progress.state == HandshakeState::kFailed) == !progress.error.empty());
    result.consumed += progress.consumedBytes;
    result.state = progress.state;
  }
  return result;
}

// In pieces or as a whole, the result must be the same.
template <typename Side>
void check(const Side& side, std::span<const std::byte> input, std::size_t pieceSize) {
  const Conversation whole = converse(side, input, input.size());
  const Conversation pieces = converse(side, input, pieceSize);
  require(whole.state == pieces.state);
  require(whole.consumed == pieces.consumed);
  require(whole.output == pieces.output);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::platform::linux_::dbus;
  if (size == 0) return 0;
  const std::vector<std::uint8_t> rest(data + 1, data + size);
  const auto input = std::as_bytes(std::span(rest));
  const std::size_t pieceSize = 1 + data[0] % 64;
  if (data[0] < 128) {
    check(ServerHandshake("0123456789abcdef0123456789abcdef", kUid), input, pieceSize);
  } else {
    check(ClientHandshake(kUid), input, pieceSize);
  }
  return 0;
}
