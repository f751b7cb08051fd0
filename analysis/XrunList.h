#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <set>
#include <unordered_map>
#include <utility>
#include <vector>

#include "analysis/ReportData.h"

namespace halvox::analysis {

// The xruns of a period that lost most, and the messages around the worst of them. Belongs to one
// thread.
//
//   addMessage() each message; addXrun() after the message of an xrun; take()
class XrunList {
 public:
  // Owns nothing; the bounds must outlive it.
  explicit XrunList(const ReportBounds& bounds) : bounds_(bounds) {}

  void addMessage(std::shared_ptr<const ReportMessage> message);
  void addXrun(ReportXrun xrun);
  // Returns the xrun with that message, or null if it is not kept.
  [[nodiscard]] ReportXrun* find(std::int64_t messageID);
  // How many xruns were not kept, and how many of those that are kept have no messages around them.
  [[nodiscard]] std::uint64_t notKept() const { return notKept_; }
  [[nodiscard]] std::uint64_t withoutContext() const { return withoutContext_; }

  // Returns the xruns in the order of their times. Call once.
  [[nodiscard]] std::vector<ReportXrun> take();

 private:
  // By what they lost; of equal ones the newer is dropped first.
  using Rank = std::pair<double, std::int64_t>;
  [[nodiscard]] static Rank rankOf(const ReportXrun& xrun) {
    return {xrun.milliseconds, -xrun.messageID};
  }
  void dropContext();
  // Keeps the messages around the worst xruns, up to the bound of their contents.
  void limitContexts();

  const ReportBounds& bounds_;
  std::deque<std::shared_ptr<const ReportMessage>> newest_;
  std::unordered_map<std::int64_t, ReportXrun> xruns_;
  std::set<Rank> ranks_;     // of xruns_
  std::set<Rank> contexts_;  // of those that have messages around them
  // Xruns whose following messages are still to come, and how many.
  std::deque<std::pair<std::int64_t, std::size_t>> following_;
  std::uint64_t notKept_ = 0;
  std::uint64_t withoutContext_ = 0;
};

}  // namespace halvox::analysis
