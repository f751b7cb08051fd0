// Writes string_hashes.txt by means of libc++, whose hash StringHash implements:
//
//   clang++ -std=c++20 -stdlib=libc++ -I. backends/testdata/WriteStringHashes.cpp -o /tmp/write
//   /tmp/write >backends/testdata/string_hashes.txt

#include <cstdio>
#include <functional>

#include "backends/testdata/HashedStrings.h"

// Compiles only with libc++: other standard libraries have another hash.
static_assert(_LIBCPP_VERSION > 0);

int main() {
  for (std::size_t index = 0; index < halvox::kHashedStrings; ++index) {
    const std::size_t hash = std::hash<std::string>{}(halvox::hashedString(index));
    std::printf("%016zx\n", hash);
  }
}
