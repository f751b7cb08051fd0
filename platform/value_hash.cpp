#include <bit>
#include <random>

#include "platform/value_detail.h"

namespace halvox::platform::detail {
namespace {

// The secret part of the hash. A client that does not know it cannot compute keys that collide.
struct Secret {
  std::uint64_t first;
  std::uint64_t second;
};

Secret makeSecret() {
  std::random_device device;
  const auto word = [&device] { return std::uint64_t{device()} << 32U | device(); };
  return {word(), word()};
}

// SipHash-1-3: one round for each block and three at the end. Hash tables of several languages use
// this variant; it is faster than SipHash-2-4 and still keyed.
class SipState {
 public:
  explicit SipState(const Secret& secret)
      : v0_(secret.first ^ 0x736f6d6570736575U),
        v1_(secret.second ^ 0x646f72616e646f6dU),
        v2_(secret.first ^ 0x6c7967656e657261U),
        v3_(secret.second ^ 0x7465646279746573U) {}

  void addBlock(std::uint64_t block) {
    v3_ ^= block;
    round();
    v0_ ^= block;
  }

  std::uint64_t finish() {
    v2_ ^= 0xffU;
    for (int count = 0; count < 3; ++count) round();
    return v0_ ^ v1_ ^ v2_ ^ v3_;
  }

 private:
  void round() {
    v0_ += v1_;
    v1_ = std::rotl(v1_, 13) ^ v0_;
    v0_ = std::rotl(v0_, 32);
    v2_ += v3_;
    v3_ = std::rotl(v3_, 16) ^ v2_;
    v0_ += v3_;
    v3_ = std::rotl(v3_, 21) ^ v0_;
    v2_ += v1_;
    v1_ = std::rotl(v1_, 17) ^ v2_;
    v2_ = std::rotl(v2_, 32);
  }

  std::uint64_t v0_, v1_, v2_, v3_;
};

}  // namespace

std::uint32_t secretHash(std::string_view text) {
  static const Secret secret = makeSecret();
  constexpr std::size_t kBlock = sizeof(std::uint64_t);
  SipState state(secret);
  std::string_view rest = text;
  for (; rest.size() >= kBlock; rest.remove_prefix(kBlock)) {
    std::uint64_t block = 0;
    std::memcpy(&block, rest.data(), kBlock);
    state.addBlock(block);
  }
  // The last block holds the remaining bytes and, in its top byte, the length. Texts that differ
  // only in trailing zero bytes therefore differ here.
  std::uint64_t last = std::uint64_t{text.size()} << 56U;
  for (std::size_t at = 0; at < rest.size(); ++at) {
    last |= std::uint64_t{static_cast<unsigned char>(rest[at])} << (8 * at);
  }
  state.addBlock(last);
  return static_cast<std::uint32_t>(state.finish());
}

}  // namespace halvox::platform::detail
