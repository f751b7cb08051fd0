#include "platform/linux/store/reading/BlockScan.h"

#include <algorithm>
#include <functional>
#include <limits>
#include <utility>
#include <vector>

#include "platform/linux/store/reading/RecordScan.h"

namespace halvox::platform::linux_ {
namespace {

// Remember the result of matching for this many names. Other names are matched each time. The
// number is bounded because clients choose the names.
constexpr std::size_t kMostNames = 4096;
constexpr std::int64_t kAfterAll = std::numeric_limits<std::int64_t>::max();

// Selects the rows with the numbers from ?1 to ?2. The row that contains ?1 may begin before it.
constexpr const char* kNewestRowFirst =
    "SELECT id, records, block FROM message_blocks"
    " WHERE id >= (SELECT ifnull(max(id), 0) FROM message_blocks WHERE id <= ?1)"
    " AND id <= ?2 AND id + records > ?1 ORDER BY id DESC";

std::size_t bytesOf(const BlockRecord& record) {
  return record.name.size() + record.application.size() + record.clientName.size() +
         record.serviceName.size() + record.payload.size();
}

}  // namespace

SqliteCode BlockScan::readNumber(std::string_view sql, std::optional<std::int64_t> argument,
                                 std::int64_t& number) {
  Statement statement;
  SqliteCode code = database_.prepare(sql, statement);
  if (code != SQLITE_OK) return code;
  if (argument.has_value()) statement.bind(1, *argument);
  code = statement.step();
  if (code == SQLITE_ROW) number = statement.integer(0);
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode BlockScan::begin() {
  SqliteCode code =
      readNumber("SELECT id + records - 1 FROM message_blocks ORDER BY id DESC LIMIT 1",
                 std::nullopt, stored_);
  last_ = filter_.before.has_value() ? std::min(stored_, *filter_.before - 1) : stored_;
  next_ = std::max<std::int64_t>(filter_.after + 1, 1);
  if (code == SQLITE_OK) code = findRanges();
  // Look for a gap after the ranges are known. If rows are removed before that, the ranges begin
  // after these rows, and reading would not notice that they are missing.
  if (code == SQLITE_OK && filter_.after > 0) {
    std::int64_t first = 0;
    code = readNumber("SELECT ifnull(min(id), 0) FROM message_blocks", std::nullopt, first);
    hasGap_ = first > next_;
  }
  if (code == SQLITE_OK && filter_.newest.has_value()) code = skipToNewest(*filter_.newest);
  if (code != SQLITE_OK) return code;
  if (filter_.order == RecordOrder::kNewestFirst) {
    return database_.prepare(std::string(kNewestRowFirst) + " LIMIT 1", read_);
  }
  // Finds the row that contains the number, or else the first row after it.
  return database_.prepare(
      "SELECT id, records, block FROM message_blocks"
      " WHERE id >= (SELECT ifnull(max(id), 0) FROM message_blocks WHERE id <= ?1)"
      " AND id <= ?2 AND id + records > ?1 ORDER BY id LIMIT 1",
      read_);
}

std::vector<BlockScan::Alternatives> BlockScan::wantedKeys() const {
  std::vector<Alternatives> wanted;
  if (!kind_.has_value()) return wanted;
  const auto isPattern = [](const std::string& name) {
    return name.find_first_of("*?[\\") != std::string::npos;
  };
  if (!filter_.names.empty() && std::ranges::none_of(filter_.names, isPattern)) {
    Alternatives& names = wanted.emplace_back();
    for (const std::string& name : filter_.names) {
      names.push_back(blockKey(BlockKeyKind::kName, name));
    }
  }
  if (kind_ == BlockRecordKind::kEvent) return wanted;
  for (const NumberMatch& match : filter_.numbers) {
    if (match.column != kLinkSessionID) continue;
    Alternatives& sessions = wanted.emplace_back();
    for (const std::int64_t session : match.numbers) sessions.push_back(sessionKey(session));
  }
  return wanted;
}

// The spans show which blocks may have records to read. The newest rows have no span. They are
// always read, because they are few.
SqliteCode BlockScan::findRanges() {
  Statement spans;
  SqliteCode code = database_.prepare(
      "SELECT span, first_time, last_time, keys FROM message_spans"
      " WHERE span >= (SELECT ifnull(max(span), 0) FROM message_spans WHERE span <= ?1)"
      " ORDER BY span",
      spans);
  if (code != SQLITE_OK) return code;
  spans.bind(1, next_);
  std::int64_t newestSpan = 0;
  code = addRanges(spans, newestSpan);
  if (code != SQLITE_OK) return code;
  std::int64_t open = newestSpan;
  code = readNumber("SELECT id + records FROM message_blocks WHERE id = ?1", newestSpan, open);
  if (code != SQLITE_OK) return code;
  const bool hasNewestSpan = !ranges_.empty() && ranges_.back().to == kAfterAll;
  if (!hasNewestSpan) ranges_.push_back({open, kAfterAll});
  return SQLITE_OK;
}

// Adds the ranges of the spans that may have records to read. If a range includes the newest span,
// it has no upper end, because the length of that span is not known here.
SqliteCode BlockScan::addRanges(Statement& spans, std::int64_t& newestSpan) {
  const std::vector<Alternatives> wanted = wantedKeys();
  const auto mayPass = [&] {
    if (filter_.since.has_value() && spans.real(2) < *filter_.since) return false;
    if (filter_.until.has_value() && spans.real(1) >= *filter_.until) return false;
    const std::string_view keys = spans.bytes(3);
    return std::ranges::all_of(wanted, [&](const Alternatives& alternatives) {
      return std::ranges::any_of(alternatives, [&](BlockKey key) { return mayHave(keys, key); });
    });
  };
  bool isInRange = false;
  SqliteCode code = SQLITE_ROW;
  while ((code = spans.step()) == SQLITE_ROW) {
    newestSpan = spans.integer(0);
    if (mayPass()) {
      if (!std::exchange(isInRange, true)) ranges_.push_back({newestSpan, kAfterAll});
    } else if (std::exchange(isInRange, false)) {
      ranges_.back().to = newestSpan;
    }
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode BlockScan::skipToNewest(std::uint64_t count) {
  missing_ = count;
  if (count == 0) {
    next_ = last_ + 1;
    return SQLITE_OK;
  }
  Statement rows;
  SqliteCode code = database_.prepare(kNewestRowFirst, rows);
  for (std::size_t range = ranges_.size(); code == SQLITE_OK && range > 0 && missing_ > 0;) {
    --range;
    rows.bind(1, std::max(next_, ranges_[range].from));
    rows.bind(2, std::min(last_, ranges_[range].to - 1));
    while (missing_ > 0 && (code = rows.step()) == SQLITE_ROW) {
      load(rows);
      if (!countNewest()) return SQLITE_CORRUPT;
    }
    rows.reset();
    if (code == SQLITE_ROW || code == SQLITE_DONE) code = SQLITE_OK;
  }
  return code;
}

// Counts the records of the loaded block that pass. If no more are missing then, reading will begin
// with the first record that is wanted. Returns false if the block is damaged.
bool BlockScan::countNewest() {
  std::vector<StoredRecordID> found;
  while (nextRecord()) found.push_back(number());
  if (found.size() >= missing_) next_ = found[found.size() - missing_];
  missing_ -= std::min<std::uint64_t>(missing_, found.size());
  return !isDamaged();
}

void BlockScan::load(const Statement& row) {
  blockID_ = row.integer(0);
  records_ = row.integer(1);
  block_ = row.bytes(2);
  reader_.open(block_, records_);
}

SqliteCode BlockScan::nextBlock(bool& found) {
  if (std::exchange(found, false)) next_ = std::max(next_, blockID_ + records_);
  while (range_ < ranges_.size() && next_ >= ranges_[range_].to) ++range_;
  if (range_ == ranges_.size()) return SQLITE_OK;
  next_ = std::max(next_, ranges_[range_].from);
  if (next_ > last_) return SQLITE_OK;
  read_.bind(1, next_);
  read_.bind(2, last_);
  const SqliteCode code = read_.step();
  found = code == SQLITE_ROW;
  if (found) load(read_);
  read_.reset();
  // Numbers have no gaps: each row begins with the number after the row before it. Retention
  // removes the rows with the lowest numbers, which is not a gap for a pass that has not begun.
  if (hasBegun_ || filter_.after > 0) hasGap_ = hasGap_ || !found || blockID_ > next_;
  hasBegun_ = true;
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

bool BlockScan::nextRecord() {
  while (reader_.next()) {
    if (number() < next_ || number() > last_) continue;
    const BlockRecordKind kind = reader_.record().kind;
    const bool isWanted = kind_.has_value() ? kind == *kind_ : kind != BlockRecordKind::kGap;
    if (isWanted && passes(reader_.record())) return true;
  }
  return false;
}

SqliteCode BlockScan::previousBlock(bool& found) {
  if (std::exchange(found, false)) last_ = std::min(last_, blockID_ - 1);
  for (; !ranges_.empty(); ranges_.pop_back()) {
    const std::int64_t first = std::max(next_, ranges_.back().from);
    const std::int64_t last = std::min(last_, ranges_.back().to - 1);
    if (first > last) continue;
    read_.bind(1, first);
    read_.bind(2, last);
    const SqliteCode code = read_.step();
    found = code == SQLITE_ROW;
    if (found) load(read_);
    read_.reset();
    if (code != SQLITE_ROW && code != SQLITE_DONE) return code;
    if (!found) continue;
    while (nextRecord()) passing_.push_back({number(), bytesOf(reader_.record())});
    return isDamaged() ? SQLITE_CORRUPT : SQLITE_OK;
  }
  return SQLITE_OK;
}

bool BlockScan::previousRecord() {
  if (!copies_.empty()) copies_.pop_back();
  if (copies_.empty() && !passing_.empty()) copyNewest();
  return !copies_.empty();
}

// Copies the newest of the records that are not copied yet.
void BlockScan::copyNewest() {
  std::size_t first = passing_.size();
  for (std::size_t bytes = 0; first > 0 && bytes < kBytesPerPiece;)
    bytes += passing_[--first].bytes;
  reader_.open(block_, records_);
  for (std::size_t wanted = first; wanted < passing_.size() && reader_.next();) {
    if (number() != passing_[wanted].id) continue;
    ++wanted;
    Copy copy{number(), reader_.record(), std::make_unique<char[]>(bytesOf(reader_.record()))};
    char* end = copy.texts.get();
    for (std::string_view* const text :
         {&copy.record.name, &copy.record.application, &copy.record.clientName,
          &copy.record.serviceName, &copy.record.payload}) {
      text->copy(end, text->size());
      *text = {end, text->size()};
      end += text->size();
    }
    copies_.push_back(std::move(copy));
  }
  passing_.resize(first);
}

bool BlockScan::passes(const BlockRecord& record) {
  if (!isWithinTimes(filter_, record.time)) return false;
  if (!kind_.has_value()) return true;
  if (kind_ == BlockRecordKind::kEvent) {
    return hasName(record.name) &&
           (!filter_.acceptsEvent || filter_.acceptsEvent({number(), record.time, record.name,
                                                           record.payload, record.application}));
  }
  for (const NumberMatch& match : filter_.numbers) {
    const std::int64_t value = match.column == kLinkSessionID  ? record.sessionID
                               : match.column == kLinkCategory ? record.category
                                                               : record.type;
    if (std::ranges::find(match.numbers, value) == match.numbers.end()) return false;
  }
  if (!hasName(record.serviceName)) return false;
  return !filter_.accepts || filter_.accepts(linkRecord(number(), record));
}

bool BlockScan::hasName(std::string_view name) {
  if (filter_.names.empty()) return true;
  const auto known = names_.find(name);
  if (known != names_.end()) return known->second;
  const bool matches = matchesAny(filter_.names, std::string(name));
  if (names_.size() < kMostNames) names_.emplace(name, matches);
  return matches;
}

StoredRecord linkRecord(StoredRecordID id, const BlockRecord& record) {
  StoredRecord made{id, record.time, {}};
  made.fields = {record.sessionID,
                 std::string(record.clientName),
                 std::string(record.serviceName),
                 record.category,
                 record.type,
                 std::string(record.payload)};
  return made;
}

}  // namespace halvox::platform::linux_
