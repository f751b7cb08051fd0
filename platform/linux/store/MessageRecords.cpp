#include "platform/linux/store/MessageRecords.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "MessageRecords"};

// Between rounds, keep memory for this many records, which is the soft limit of the queue. Free the
// memory that a burst needed beyond that.
constexpr std::size_t kKeptRecords = 8192;

}  // namespace

MessageRecords::MessageRecords(EventNames& names, WriterQueue& queue, StatisticsService& statistics,
                               std::uint64_t longestPayload)
    : names_(names),
      queue_(queue),
      events_(statistics, "analytics"),
      links_(statistics, "link local"),
      longestPayload_(longestPayload) {}

void MessageRecords::addEvent(double time, std::string_view name, AnalyticsPayloadBuilder builder) {
  // Look the name up before add() takes the queue's lock, which all senders share. The look-up
  // itself needs no lock.
  Event event{time, names_.find(name), nullptr, std::move(builder)};
  if (event.name == nullptr) {
    event.ownName = std::make_unique<EventName>(name, true);
    event.name = event.ownName.get();
  }
  // Count before add(), which may wait for room. The counts then include records whose callers
  // wait.
  events_.counters.addReceived();
  if (!queue_.add([&] { queued_.emplace_back(std::move(event)); })) {
    events_.counters.addDropped(DropReason::kClosed, 1);
  }
}

bool MessageRecords::addLink(LinkMessageRecord record) {
  links_.counters.addReceived();
  const bool added = queue_.add([&] { queued_.emplace_back(std::move(record)); });
  if (!added) links_.counters.addDropped(DropReason::kClosed, 1);
  return added;
}

void MessageRecords::takeQueued() {
  taken_.clear();
  // Free the memory before the swap, because callers add the next records to this vector.
  if (taken_.capacity() > kKeptRecords) taken_ = std::vector<Record>();
  taken_.swap(queued_);
  next_ = 0;
}

SqliteCode MessageRecords::prepare(Database& database) { return blocks_.prepare(database); }

SqliteCode MessageRecords::write(TransactionAllowance& allowance) {
  if (!hasTaken()) return SQLITE_OK;
  const auto most =
      std::min<std::int64_t>(allowance.records, static_cast<std::int64_t>(taken_.size() - next_));
  SqliteCode code = blocks_.begin(static_cast<std::uint64_t>(std::max<std::int64_t>(most, 0)));
  while (code == SQLITE_OK && hasTaken() && !allowance.isUsedUp()) code = writeNext(allowance);
  return code == SQLITE_OK ? blocks_.end() : code;
}

SqliteCode MessageRecords::writeNext(TransactionAllowance& allowance) {
  // Move the record out of the vector. Its memory is then freed at once, not after the whole batch.
  Record record = std::move(taken_[next_]);
  Port& port = portOf(record);
  ++next_;
  ++port.written;
  --allowance.records;
  auto* const event = std::get_if<Event>(&record);
  auto* const link = std::get_if<LinkMessageRecord>(&record);
  AnalyticsPayload payload;
  if (link != nullptr) {
    payload = std::move(link->payload);
  } else if (event->builder) {
    payload = event->builder();
  }
  const std::string_view text = encoder_.encode(payload.entries(), payload.added());
  // Count the payload of the two events of a message once, because both hold the same message while
  // they wait. Their payloads share its entries, unless the message has an application of its own.
  if (!encoder_.isRepeated()) writtenBytes_ += text.size();
  if (text.size() > longestPayload_) {
    ++port.tooLarge;
    return SQLITE_OK;
  }
  const std::uint64_t before = blocks_.bytes();
  SqliteCode code = SQLITE_OK;
  if (link != nullptr) {
    code = blocks_.addLink(link->time, {*link->party, link->category, link->type}, text);
  } else {
    static const Key applicationKey("HostApplicationDisplayID");
    const Value* const application = payload.find(applicationKey);
    const std::string_view name = application == nullptr ? "" : application->string();
    code = blocks_.addEvent(event->time, {.name = event->name->text, .application = name}, text);
  }
  allowance.payloadBytes -= static_cast<std::int64_t>(blocks_.bytes() - before);
  return code;
}

void MessageRecords::onCommitted(FinishedRecords& finished) {
  blocks_.onCommitted();
  for (Port* const port : {&events_, &links_}) {
    port->counters.addStored(port->written - port->tooLarge);
  }
  endTransaction(finished);
}

void MessageRecords::endTransaction(FinishedRecords& finished) {
  // Free the memory of a long text, because the next record may come only after hours. The summary
  // of a long session has many megabytes.
  encoder_.giveBack();
  if (!hasTaken()) {
    taken_.clear();
    next_ = 0;
  }
  for (Port* const port : {&events_, &links_}) {
    finished.written += std::exchange(port->written, 0);
    const std::uint64_t tooLarge = std::exchange(port->tooLarge, 0);
    if (tooLarge == 0) continue;
    port->counters.addDropped(DropReason::kTooLarge, tooLarge);
    if (tooLargeLines_.tryPass()) {
      kLog.error("dropped ", port == &events_ ? "an event" : "a link message",
                 ": its payload is longer than ", longestPayload_, " bytes");
    }
  }
  finished.writtenBytes += std::exchange(writtenBytes_, 0);
}

std::uint64_t MessageRecords::dropTaken(DropReason reason, FinishedRecords& finished) {
  blocks_.onRolledBack();
  std::uint64_t dropped = 0;
  for (Port* const port : {&events_, &links_}) {
    const std::uint64_t written = port->written - port->tooLarge;
    port->counters.addDropped(reason, written);
    dropped += written;
  }
  for (; next_ < taken_.size(); ++next_) {
    portOf(taken_[next_]).counters.addDropped(reason, 1);
    ++finished.unwritten;
    ++dropped;
  }
  endTransaction(finished);
  taken_.clear();
  next_ = 0;
  return dropped;
}

}  // namespace halvox::platform::linux_
