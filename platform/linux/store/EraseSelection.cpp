#include "platform/linux/store/EraseSelection.h"

#include <algorithm>
#include <bit>
#include <charconv>
#include <system_error>
#include <utility>

#include "platform/linux/store/JsonText.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kStampKey = "\"hvreporting_timestamp\":";
constexpr unsigned kVarintBits = 7;

// Returns a length as Protocol Buffers write it.
std::string varint(std::size_t number) {
  constexpr std::size_t kMore = std::size_t{1} << kVarintBits;
  std::string bytes;
  for (; number >= kMore; number >>= kVarintBits) {
    bytes += static_cast<char>(number % kMore + kMore);
  }
  bytes += static_cast<char>(number);
  return bytes;
}

}  // namespace

std::optional<double> stampOf(std::string_view payload) {
  // The service adds the stamp after all keys of the client. A text cannot contain this key,
  // because its quotes would be escaped.
  const std::size_t key = payload.rfind(kStampKey);
  if (key == std::string_view::npos) return std::nullopt;
  const std::string_view rest = payload.substr(key + kStampKey.size());
  double stamp = 0;
  const auto read = std::from_chars(rest.data(), rest.data() + rest.size(), stamp);
  if (read.ec != std::errc()) return std::nullopt;
  return stamp;
}

EraseSelection::EraseSelection(EraseRequest request) : request_(std::move(request)) {
  if (!request_.application) return;
  JsonText text;
  text.append(std::string_view(*request_.application));
  quoted_ = text.view();
  prefixed_ = varint(request_.application->size()) + *request_.application;
}

bool EraseSelection::isNamedIn(const ErasableRecord& record) const {
  if (!request_.application) return false;
  return record.application == *request_.application ||
         record.payload.find(quoted_) != std::string_view::npos ||
         (record.kind == ErasableRecord::Kind::kOther &&
          record.payload.find(prefixed_) != std::string_view::npos);
}

void EraseSelection::look(const ErasableRecord& record) {
  const bool isOwn = request_.session ? record.kind == ErasableRecord::Kind::kLink &&
                                            record.sessionID == *request_.session
                                      : isNamedIn(record);
  if (!isOwn) return;
  if (const auto stamp = stampOf(record.payload)) {
    const auto bits = std::bit_cast<std::uint64_t>(*stamp);
    // The two events of a message have the same stamp.
    if (stamps_.empty() || stamps_.back() != bits) stamps_.push_back(bits);
  }
}

void EraseSelection::endLook() {
  std::ranges::sort(stamps_);
  stamps_.erase(std::unique(stamps_.begin(), stamps_.end()), stamps_.end());
}

bool EraseSelection::hasStamp(double stamp) const {
  return std::ranges::binary_search(stamps_, std::bit_cast<std::uint64_t>(stamp));
}

void EraseSelection::announce(const ErasableRecord& record) {
  if (record.kind != ErasableRecord::Kind::kEvent || isNamedIn(record)) return;
  if (const auto stamp = stampOf(record.payload)) noteOther(std::bit_cast<std::uint64_t>(*stamp));
}

bool EraseSelection::selects(const ErasableRecord& record) {
  if (record.isOfAll) return true;
  if (record.kind == ErasableRecord::Kind::kLink) return selectsLink(record);
  if (isNamedIn(record)) return true;
  if (record.kind == ErasableRecord::Kind::kOther) return false;
  const auto stamp = stampOf(record.payload);
  if (!stamp) return false;
  // An event with the stamp of an application's event and another name is not that application's:
  // a message for several sessions makes events of each.
  if (request_.session && hasStamp(*stamp)) return true;
  noteOther(std::bit_cast<std::uint64_t>(*stamp));
  return false;
}

bool EraseSelection::selectsLink(const ErasableRecord& record) {
  if (request_.session) return record.sessionID == *request_.session;
  const auto stamp = stampOf(record.payload);
  const bool isOwn = isNamedIn(record) || (stamp && hasStamp(*stamp));
  const bool isOther = !isOwn && stamp && others_.contains(std::bit_cast<std::uint64_t>(*stamp));
  if (!isOwn && !isOther) {
    const auto session = sessions_.find(record.sessionID);
    return session != sessions_.end() && session->second;
  }
  if (sessions_.size() >= kMostSessions) sessions_.clear();
  sessions_.insert_or_assign(record.sessionID, isOwn);
  return isOwn;
}

void EraseSelection::noteOther(std::uint64_t stamp) {
  if (!request_.application || !others_.insert(stamp).second) return;
  oldest_.push_back(stamp);
  if (oldest_.size() <= kMostStamps) return;
  others_.erase(oldest_.front());
  oldest_.pop_front();
}

}  // namespace halvox::platform::linux_
