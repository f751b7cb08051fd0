#include "session/SessionHistory.h"

#include "platform/clock.h"
#include "platform/overflow.h"
#include "platform/services.h"
#include "session/SessionLog.h"

namespace halvox {
namespace {

// The fewest bytes of one history that are moved out: moving fewer costs more than it saves.
constexpr std::size_t kLeastToMove = 4 * 1024;
// Bytes that one history may hold in memory: tens of thousands of ordinary messages, so that most
// sessions never touch the disk.
constexpr std::size_t kMostInMemory = 1024 * 1024;
// The pause before a write that failed is tried again. The store has the same one.
constexpr std::chrono::milliseconds kRetryTime{250};

// Errors are never suppressed, however often they repeat. The category is compared as a whole. An
// error category with a domain is therefore not exempt; this is required.
bool isExemptFromSuppression(AudioEventCategory category, AudioEventType type) {
  return category == AudioEventCategory::kError || type == AudioEventType::kError;
}

}  // namespace

bool SessionHistory::isRedundant(const platform::Dictionary* previous, AudioEventCategory category,
                                 AudioEventType type, const platform::Dictionary& message) {
  return previous != nullptr && !isExemptFromSuppression(category, type) &&
         equalApartFromVolatileKeys(*previous, message);
}

void SessionHistory::begin() {
  std::optional<MessageHistory> previous(std::in_place);  // destroyed without the lock
  auto volumes = std::make_unique<VolumeHistory>();
  const Lock history = lock();
  history->swap(previous);
  volumes_.swap(volumes);
  nextTry_ = nextVolumeTry_ = {};
}

std::optional<MessageHistory> SessionHistory::end() {
  std::optional<MessageHistory> ended;
  std::unique_ptr<VolumeHistory> volumes;  // destroyed without the lock
  const Lock history = lock();
  if (!history->has_value()) return ended;
  // The charge is removed here, because the history itself does not know the account.
  held_.change(memorySize(**history), 0);
  volumes.swap(volumes_);
  ended.swap(*history);
  return ended;
}

std::optional<MessageHistory> SessionHistory::take() {
  std::optional<MessageHistory> taken;
  const Lock history = lock();
  if (!history->has_value()) return taken;
  const std::size_t before = memorySize(**history);
  taken.emplace();
  taken.swap(*history);
  held_.change(before, memorySize(**history));
  return taken;
}

std::unique_ptr<const MessageHistory> SessionHistory::takeVolumeMessages() {
  const Lock history = lock();
  if (!history->has_value()) return nullptr;
  const std::size_t before = memorySize(**history);
  auto messages = volumes_->take();
  held_.change(before, memorySize(**history));
  return messages;
}

std::size_t SessionHistory::size() const {
  const Lock history = lock();
  return history->has_value() ? (*history)->size() : 0;
}

SessionHistory::Outcome SessionHistory::recordLocked(const Lock& history,
                                                     AudioEventCategory category,
                                                     AudioEventType type,
                                                     const platform::Dictionary& message) {
  if (!history->has_value()) return Outcome::kNotStarted;
  MessageHistory& messages = **history;
  const std::size_t before = memorySize(messages);
  MessageHistory::Base& base = messages.base(category, type);
  // Only the newest message of the same category and type is compared, however old it is. Of the
  // messages A, B, A all three are recorded, and two equal messages an hour apart are a repetition.
  // Both are required.
  const platform::Dictionary* previous = messages.newestMessage(base);
  Outcome outcome = Outcome::kRecorded;
  if (isRedundant(previous, category, type, message)) {
    kSessionLog.debug("dropping redundant event");
    outcome = Outcome::kRedundant;
  } else if (makeRoom(messages)) {
    volumes_->add(message, messages.append(base, message));
  } else {
    messages.lose(base, message);
    outcome = Outcome::kNoRoom;
  }
  // Called even if nothing was recorded, because the table of codes may have grown.
  held_.change(before, memorySize(messages));
  return outcome;
}

// When a history takes much memory, it goes on in a file. It loses a message only if writing the
// file fails, for instance because the disk is full.
//
// The messages and the volume messages are moved separately, each if it is worth a write of its
// own. If their sizes were added, a few volume messages would make a client over its share move
// every message alone.
bool SessionHistory::makeRoom(MessageHistory& messages) {
  const std::size_t movable = messages.movableSize();
  const std::size_t movableVolumes = volumes_->movableSize();
  if (movable < kLeastToMove && movableVolumes < kLeastToMove) return true;
  if (movable + movableVolumes < kMostInMemory && !isClientOverItsShare()) return true;
  return tryToMoveOut(messages);
}

// A full disk stays full for many messages. A loss is therefore logged once in a run, and a write
// of 64 KiB is not repeated for each message.
bool SessionHistory::tryToMoveOut(MessageHistory& messages) {
  const std::chrono::milliseconds now = platform::clock().processUptime();
  const bool isRoomNeeded = messages.movableSize() >= kLeastToMove;
  if (now < nextTry_) return !isRoomNeeded;
  auto error = isRoomNeeded ? messages.moveOut() : std::nullopt;
  if (!error.has_value()) {
    // The message has room now. If the volume messages cannot be moved, they stay in memory: there
    // are at most two a second, and they grow only while messages are recorded.
    const bool isTry = volumes_->movableSize() >= kLeastToMove && now >= nextVolumeTry_;
    if (isTry && volumes_->moveOut()) nextVolumeTry_ = now + kRetryTime;
    return true;
  }
  nextTry_ = now + kRetryTime;
  if (messages.lost() == 0) {
    kSessionLog.error("cannot move the history of reporter ", number(reporterID_),
                      " out of memory: ", error->description,
                      "; its messages are missing from the summary until there is room");
  }
  return false;
}

bool SessionHistory::isClientOverItsShare() const {
  const std::shared_ptr<ResourceAccount>& account = held_.account();
  return account != nullptr && account->use().bytes > platform::overflow().memoryPerClient();
}

}  // namespace halvox
