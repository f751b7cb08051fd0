#include "session/VolumeHistory.h"

#include <utility>

#include "backends/HVReportingUtility.h"

namespace halvox {

using platform::Dictionary;

// The minimum is asked for now and not at the stop, when the session may have another type. All
// types have the same minimum.
VolumeHistory::VolumeHistory()
    : intervals_(HVReportingUtilityVolumeMinimumPlayingTime(AudioServiceType::kUnknown)) {}

void VolumeHistory::add(const Dictionary& message, std::optional<std::uint32_t> form) {
  if (!isConcerned(message, form)) return;
  auto ended = intervals_.add(message);
  sizeOfIntervals_ = intervals_.memorySize();
  if (!ended.has_value()) return;
  if (ended_ == nullptr) ended_ = std::make_unique<MessageHistory>();
  ended_->append(ended_->base(AudioEventCategory::kVolume, AudioEventType::kSummary),
                 std::move(*ended));
}

bool VolumeHistory::isConcerned(const Dictionary& message, std::optional<std::uint32_t> form) {
  if (!form.has_value()) return VolumeIntervals::isConcernedWith(message);
  if (*form >= concerns_.size()) concerns_.resize(*form + std::size_t{1}, Concern::kUnknown);
  Concern& concern = concerns_[*form];
  if (concern == Concern::kUnknown) {
    concern = VolumeIntervals::isConcernedWith(message) ? Concern::kVolume : Concern::kNone;
  }
  return concern == Concern::kVolume;
}

std::unique_ptr<const MessageHistory> VolumeHistory::take() { return std::move(ended_); }

std::size_t VolumeHistory::memorySize() const {
  return sizeOfIntervals_ + (ended_ == nullptr ? 0 : sizeof(MessageHistory) + ended_->memorySize());
}

std::size_t VolumeHistory::movableSize() const {
  return ended_ == nullptr ? 0 : ended_->movableSize();
}

std::optional<platform::Error> VolumeHistory::moveOut() {
  return ended_ == nullptr ? std::nullopt : ended_->moveOut();
}

}  // namespace halvox
