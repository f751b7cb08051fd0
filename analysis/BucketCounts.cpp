#include "analysis/BucketCounts.h"

#include <algorithm>
#include <cmath>
#include <iterator>

namespace halvox::analysis {

void BucketCounts::add(double lower, double upper, std::uint64_t hits) {
  hits = std::min(hits, kMostHits - count_);
  if (hits == 0) return;
  const auto bounds = std::make_pair(lower, upper);
  auto found = buckets_.find(bounds);
  if (found == buckets_.end()) {
    if (buckets_.size() >= kMostBuckets) {
      notKept_ = std::min(kMostHits, notKept_ + hits);
      return;
    }
    found = buckets_.emplace(bounds, 0).first;
  }
  found->second += hits;
  count_ += hits;
}

void BucketCounts::addValue(double value) {
  if (!(value > 1)) return add(0, 1, 1);
  const double upper = std::exp2(std::ceil(std::log2(value)));
  add(upper / 2, upper, 1);
}

std::vector<BucketCounts::Bucket> BucketCounts::buckets() const {
  std::vector<Bucket> list;
  list.reserve(buckets_.size());
  for (const auto& [bounds, hits] : buckets_) list.push_back({bounds.first, bounds.second, hits});
  return list;
}

double BucketCounts::percentile(double share) const {
  const auto rank = static_cast<std::uint64_t>(std::ceil(share * static_cast<double>(count_)));
  std::uint64_t passed = 0;
  for (const auto& [bounds, hits] : buckets_) {
    passed += hits;
    if (passed >= std::max<std::uint64_t>(rank, 1)) {
      return std::isinf(bounds.second) ? bounds.first : bounds.second;
    }
  }
  return 0;
}

}  // namespace halvox::analysis
