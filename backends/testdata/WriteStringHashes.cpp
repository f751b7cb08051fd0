// Writes string_hashes.txt, with the standard library whose hash StringHash has:
//
//   clang++ -std=c++20 -stdlib=libc++ -I. backends/testdata/WriteStringHashes.cpp -o /tmp/write
//   /tmp/write >backends/testdata/string_hashes.txt

#include <cstdio>
#include <functional>

#include "backends/testdata/HashedStrings.h"

#ifndef _LIBCPP_VERSION
#error "this standard library has another hash"
#endif

int main() {
  for (std::size_t index = 0; index < halvox::kHashedStrings; ++index) {
    const std::size_t hash = std::hash<std::string>{}(halvox::hashedString(index));
    std::printf("%016zx\n", hash);
  }
}
