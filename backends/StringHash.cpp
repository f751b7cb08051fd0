#include "backends/StringHash.h"

#include <bit>
#include <cstddef>
#include <cstring>

namespace halvox {
namespace {

// The primes of the algorithm, all between 2^63 and 2^64.
constexpr std::uint64_t kPrime0 = 0xc3a5c85c97cb3127U;
constexpr std::uint64_t kPrime1 = 0xb492b66fbe98f273U;
constexpr std::uint64_t kPrime2 = 0x9ae16a3b2f90404fU;
constexpr std::uint64_t kPrime3 = 0xc949d7c7509e6557U;
constexpr std::uint64_t kFinalMultiplier = 0x9ddfea08eb382d69U;

constexpr std::size_t kBlock = 64;

// All arithmetic is modulo 2^64. Words are read in the byte order of this machine, as libc++ does.
template <typename Word>
Word wordAt(std::string_view text, std::size_t offset) {
  Word word;
  // The offset need not be aligned.
  std::memcpy(&word, text.data() + offset, sizeof word);
  return word;
}
std::uint64_t word(std::string_view text, std::size_t offset) {
  return wordAt<std::uint64_t>(text, offset);
}
// Returns the word that begins `distance` bytes before the end.
std::uint64_t wordBeforeEnd(std::string_view text, std::size_t distance) {
  return word(text, text.size() - distance);
}

std::uint64_t foldHigh(std::uint64_t value) { return value ^ (value >> 47); }

std::uint64_t combine(std::uint64_t first, std::uint64_t second) {
  const std::uint64_t mixed = foldHigh((first ^ second) * kFinalMultiplier);
  return foldHigh((second ^ mixed) * kFinalMultiplier) * kFinalMultiplier;
}

std::uint64_t hashUpTo16(std::string_view text) {
  const std::size_t length = text.size();
  if (length > 8) {
    const std::uint64_t last = wordBeforeEnd(text, 8);
    return combine(word(text, 0), std::rotr(last + length, static_cast<int>(length))) ^ last;
  }
  if (length >= 4) {
    const auto first = wordAt<std::uint32_t>(text, 0);
    const auto last = wordAt<std::uint32_t>(text, length - 4);
    // Shift in 32 bits and lose the upper bits. The published algorithm keeps them, but libc++ does
    // not, and this must give libc++'s hashes.
    const std::uint32_t shifted = first << 3;
    return combine(length + shifted, last);
  }
  if (length == 0) return kPrime2;
  const auto byteAt = [text](std::size_t offset) {
    return std::uint32_t{static_cast<unsigned char>(text[offset])};
  };
  const std::uint32_t front = byteAt(0) + (byteAt(length / 2) << 8);
  const std::uint32_t back = static_cast<std::uint32_t>(length) + (byteAt(length - 1) << 2);
  return foldHigh(front * kPrime2 ^ back * kPrime3) * kPrime2;
}

std::uint64_t hashUpTo32(std::string_view text) {
  const std::uint64_t first = word(text, 0) * kPrime1;
  const std::uint64_t second = word(text, 8);
  const std::uint64_t last = wordBeforeEnd(text, 8) * kPrime2;
  const std::uint64_t lastButOne = wordBeforeEnd(text, 16) * kPrime0;
  return combine(std::rotr(first - second, 43) + std::rotr(last, 30) + lastButOne,
                 first + std::rotr(second ^ kPrime3, 20) - last + text.size());
}

struct Pair {
  std::uint64_t first;
  std::uint64_t second;
};

// Mixes four words into two, starting from `start`. The first result is the sum of the words; the
// second depends on their order.
Pair mixWords(Pair start, std::uint64_t w, std::uint64_t x, std::uint64_t y, std::uint64_t z,
              int rotation) {
  const std::uint64_t begin = start.first + w;
  const std::uint64_t middle = begin + x + y;
  return {middle + z,
          std::rotr(start.second + begin + z, rotation) + std::rotr(middle, 44) + begin};
}

// Mixes the 32 bytes at an offset.
Pair mix32(std::string_view text, std::size_t offset, Pair start) {
  return mixWords(start, word(text, offset), word(text, offset + 8), word(text, offset + 16),
                  word(text, offset + 24), 21);
}

// Mixes one half of a text of 33 to 64 bytes: sums of four words, with rotations between them.
Pair mixHalf(std::uint64_t a, std::uint64_t b, std::uint64_t c, std::uint64_t d) {
  const std::uint64_t two = a + b;
  const std::uint64_t three = two + c;
  return {three + d,
          std::rotr(a + d, 52) + std::rotr(three, 31) + std::rotr(a, 37) + std::rotr(two, 7)};
}

std::uint64_t hashUpTo64(std::string_view text) {
  const std::uint64_t fourth = word(text, 24);
  const Pair front = mixHalf(word(text, 0) + (text.size() + wordBeforeEnd(text, 16)) * kPrime0,
                             word(text, 8), word(text, 16), fourth);
  const Pair back = mixHalf(word(text, 16) + wordBeforeEnd(text, 32), wordBeforeEnd(text, 24),
                            wordBeforeEnd(text, 16), fourth + wordBeforeEnd(text, 8));
  const std::uint64_t mixed =
      foldHigh((front.first + back.second) * kPrime2 + (back.first + front.second) * kPrime0);
  return foldHigh(mixed * kPrime0 + front.second) * kPrime2;
}

// The state between the blocks of a long text.
struct State {
  std::uint64_t x;
  std::uint64_t y;
  std::uint64_t z;
  Pair v;
  Pair w;

  // Starts from the last 64 bytes.
  explicit State(std::string_view text)
      : x(wordBeforeEnd(text, 40)),
        y(wordBeforeEnd(text, 16) + wordBeforeEnd(text, 56)),
        z(combine(wordBeforeEnd(text, 48) + text.size(), wordBeforeEnd(text, 24))),
        v(mix32(text, text.size() - 64, {text.size(), z})),
        w(mix32(text, text.size() - 32, {y + kPrime1, x})) {
    x = x * kPrime1 + word(text, 0);
  }

  // Mixes the block at an offset into the state. Each line uses results of the lines before it:
  // keep their order.
  void take(std::string_view text, std::size_t offset) {
    x = std::rotr(x + y + v.first + word(text, offset + 8), 37) * kPrime1;
    y = std::rotr(y + v.second + word(text, offset + 48), 42) * kPrime1;
    x ^= w.second;
    y += v.first + word(text, offset + 40);
    z = std::rotr(z + w.first, 33) * kPrime1;
    v = mix32(text, offset, {v.second * kPrime1, x + w.first});
    w = mix32(text, offset + 32, {z + w.second, y + word(text, offset + 16)});
    const std::uint64_t swapped = z;
    z = x;
    x = swapped;
  }

  [[nodiscard]] std::uint64_t result() const {
    return combine(combine(v.first, w.first) + foldHigh(y) * kPrime1 + z,
                   combine(v.second, w.second) + x);
  }
};

std::uint64_t hashLong(std::string_view text) {
  State state(text);
  // The constructor has used the last bytes: skip the last block here.
  for (std::size_t offset = 0; offset + kBlock < text.size(); offset += kBlock) {
    state.take(text, offset);
  }
  return state.result();
}

}  // namespace

std::uint64_t hashString(std::string_view text) {
  if (text.size() <= 16) return hashUpTo16(text);
  if (text.size() <= 32) return hashUpTo32(text);
  if (text.size() <= kBlock) return hashUpTo64(text);
  return hashLong(text);
}

}  // namespace halvox
