#pragma once

#include <algorithm>
#include <cstdint>
#include <random>
#include <string>

#include "backends/AudioIssueDetected.h"

namespace halvox::zubmetrics {

// Makes random messages, with the largest numbers more often than by chance. The same seed gives
// the same messages.
class RandomIssues {
 public:
  RandomIssues(std::uint64_t seed, std::size_t longestText)
      : random_(seed), longestText_(longestText) {}

  AudioIssueDetected next() {
    AudioIssueDetected issue;
    issue.setIssueType(text());
    issue.setNode(text());
    issue.setRtaidClient(text());
    issue.setDuration(static_cast<std::int32_t>(number()));
    if (random_() % 2 == 0) issue.setTimestamp(number());
    return issue;
  }

 private:
  // Returns a number of any length in bits.
  std::uint64_t number() {
    const std::uint64_t all = random_() % 8 == 0 ? ~std::uint64_t{0} : random_();
    return all >> (random_() % 64);
  }
  std::string text() {
    std::string made(random_() % (longestText_ + 1), '\0');
    std::ranges::generate(made, [this] { return static_cast<char>(random_()); });
    return made;
  }

  std::mt19937_64 random_;
  const std::size_t longestText_;
};

}  // namespace halvox::zubmetrics
