#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string_view>
#include <utility>
#include <vector>

namespace halvox::analysis {

// A histogram that is merged from others. Each bucket has a lower and an upper bound; a bucket of
// other bounds is a bucket of its own. Belongs to one thread.
class BucketCounts {
 public:
  // More distinct bounds than this are counted in notKept(): the bounds come from clients.
  static constexpr std::size_t kMostBuckets = 128;
  // Further hits are ignored: a client can report any number, and the sum must not overflow. A
  // double holds every number up to this one.
  static constexpr std::uint64_t kMostHits = std::uint64_t{1} << 53U;

  struct Bucket {
    double lower = 0;
    double upper = 0;  // infinity: there is no bound
    std::uint64_t hits = 0;
  };

  void add(double lower, double upper, std::uint64_t hits);
  // Counts one value in the bucket between two neighbouring powers of 2. Values up to 1, and what
  // is not a number, are in the first one.
  void addValue(double value);

  [[nodiscard]] std::uint64_t count() const { return count_; }
  [[nodiscard]] std::uint64_t notKept() const { return notKept_; }
  // In the order of their bounds.
  [[nodiscard]] std::vector<Bucket> buckets() const;
  // The upper bound of the bucket that holds the value which this share of all values does not
  // exceed: 0.5 is the median. In a bucket without an upper bound it is the lower bound, which the
  // value exceeds. 0 if nothing was counted.
  [[nodiscard]] double percentile(double share) const;

 private:
  std::map<std::pair<double, double>, std::uint64_t> buckets_;
  std::uint64_t count_ = 0;  // in buckets_
  std::uint64_t notKept_ = 0;
};

}  // namespace halvox::analysis
