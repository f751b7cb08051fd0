#include "platform/linux/store/blocks/MessageTables.h"

#include <algorithm>
#include <cstdint>
#include <exception>
#include <limits>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include <sqlite3ext.h>

#include "platform/linux/store/blocks/BlockKeys.h"
#include "platform/linux/store/blocks/MessageBlockReader.h"

#ifdef HALVOX_SQLITE_EXTENSION
SQLITE_EXTENSION_INIT1
#endif

namespace halvox::platform::linux_ {
namespace {

constexpr int kTimeColumn = 0;
// A hidden column of halvox_events: neither `SELECT *` nor the view has it.
constexpr int kApplicationColumn = 3;

// Flags that xBestIndex passes to xFilter. They say which conditions come as arguments, in this
// order. A condition on a column whose values are keys of blocks has the flag kKeyOfColumn, shifted
// by the number of the column.
constexpr unsigned kSince = 1;
constexpr unsigned kUntil = 2;
constexpr unsigned kAt = 4;
constexpr unsigned kKeyOfColumn = 8;
constexpr int kKeyColumns = 4;

// Returns the kind of keys that the values of a column are; std::nullopt if they are not keys.
std::optional<BlockKeyKind> keyKindOf(BlockRecordKind kind, int column) {
  if (kind == BlockRecordKind::kEvent) {
    if (column == 1) return BlockKeyKind::kName;
    if (column == kApplicationColumn) return BlockKeyKind::kApplication;
    return std::nullopt;
  }
  if (column == 1) return BlockKeyKind::kSession;
  if (column == 2) return BlockKeyKind::kApplication;
  if (column == 3) return BlockKeyKind::kName;
  return std::nullopt;
}

// One of the two tables. `kind` points to a static variable.
struct MessageTable : sqlite3_vtab {
  sqlite3* database;
  const BlockRecordKind* kind;
};

// One pass over the blocks. The reader refers to the bytes in the current row of `block`.
struct MessageCursor : sqlite3_vtab_cursor {
  ~MessageCursor() {
    sqlite3_finalize(blocks);
    sqlite3_finalize(block);
  }
  sqlite3_stmt* blocks = nullptr;  // the numbers of the blocks to read, and their keys
  sqlite3_stmt* block = nullptr;
  std::vector<BlockKey> wanted;  // keys that a block must have
  MessageBlockReader reader;
  std::int64_t blockID = 0;
  bool isAtEnd = true;
};

MessageTable& tableOf(sqlite3_vtab* table) { return *static_cast<MessageTable*>(table); }
MessageCursor& cursorOf(sqlite3_vtab_cursor* cursor) {
  return *static_cast<MessageCursor*>(cursor);
}

int connect(sqlite3* database, void* kind, int /*count*/, const char* const* /*arguments*/,
            sqlite3_vtab** table, char** /*error*/) {
  const auto* const which = static_cast<const BlockRecordKind*>(kind);
  const int code = sqlite3_declare_vtab(
      database, *which == BlockRecordKind::kEvent
                    ? "CREATE TABLE x(time REAL, name TEXT, payload TEXT, application TEXT HIDDEN)"
                    : "CREATE TABLE x(time REAL, session_id INTEGER, client_name TEXT,"
                      " service_name TEXT, category INTEGER, type INTEGER, payload TEXT)");
  if (code != SQLITE_OK) return code;
  // Declare the tables as innocuous, because they read only this database. Views may then use them
  // even if trusted_schema is off.
  sqlite3_vtab_config(database, SQLITE_VTAB_INNOCUOUS);
  auto made = std::make_unique<MessageTable>();
  made->database = database;
  made->kind = which;
  *table = made.release();
  return SQLITE_OK;
}

int disconnect(sqlite3_vtab* table) {
  const std::unique_ptr<MessageTable> owned(&tableOf(table));
  return SQLITE_OK;
}

int openCursor(sqlite3_vtab* /*table*/, sqlite3_vtab_cursor** cursor) {
  *cursor = std::make_unique<MessageCursor>().release();
  return SQLITE_OK;
}

int closeCursor(sqlite3_vtab_cursor* cursor) {
  const std::unique_ptr<MessageCursor> owned(&cursorOf(cursor));
  return SQLITE_OK;
}

// Returns the flag of a condition that allows skipping blocks, or 0 for any other condition.
unsigned flagOf(BlockRecordKind kind, const sqlite3_index_info* info, int index) {
  const auto& constraint = info->aConstraint[index];
  if (constraint.usable == 0) return 0;
  const bool isEqual = constraint.op == SQLITE_INDEX_CONSTRAINT_EQ;
  if (constraint.iColumn != kTimeColumn) {
    if (!isEqual || !keyKindOf(kind, constraint.iColumn).has_value()) return 0;
    // Under NOCASE and other collations, texts with different keys can be equal.
    const char* const collation =
        sqlite3_vtab_collation(const_cast<sqlite3_index_info*>(info), index);
    if (sqlite3_stricmp(collation, "BINARY") != 0) return 0;
    return kKeyOfColumn << static_cast<unsigned>(constraint.iColumn);
  }
  switch (constraint.op) {
    case SQLITE_INDEX_CONSTRAINT_GT:
    case SQLITE_INDEX_CONSTRAINT_GE:
      return kSince;
    case SQLITE_INDEX_CONSTRAINT_LT:
    case SQLITE_INDEX_CONSTRAINT_LE:
      return kUntil;
    case SQLITE_INDEX_CONSTRAINT_EQ:
      return kAt;
    default:
      return 0;
  }
}

// Takes one condition for each flag. The conditions need not be exact, because SQLite tests each
// row again.
int chooseIndex(sqlite3_vtab* table, sqlite3_index_info* info) {
  const BlockRecordKind kind = *tableOf(table).kind;
  unsigned flags = 0;
  int arguments = 0;
  for (unsigned flag = kSince; flag < kKeyOfColumn << kKeyColumns; flag <<= 1U) {
    for (int index = 0; index < info->nConstraint; ++index) {
      if (flagOf(kind, info, index) != flag) continue;
      info->aConstraintUsage[index].argvIndex = ++arguments;
      flags |= flag;
      break;
    }
  }
  info->idxNum = static_cast<int>(flags);
  constexpr double kAll = 1e9;
  info->estimatedCost = kAll / (1 + 30.0 * arguments);
  return SQLITE_OK;
}

int fail(MessageCursor& cursor, int code, const char* text) {
  cursor.isAtEnd = true;
  sqlite3_free(cursor.pVtab->zErrMsg);
  cursor.pVtab->zErrMsg = sqlite3_mprintf("%s", text);
  return code;
}

std::string_view bytesOf(sqlite3_stmt* row, int column) {
  const auto* const bytes = static_cast<const char*>(sqlite3_column_blob(row, column));
  const auto length = static_cast<std::size_t>(sqlite3_column_bytes(row, column));
  return bytes == nullptr ? std::string_view() : std::string_view(bytes, length);
}

// Opens the next block that may have wanted records. Returns SQLITE_ROW, SQLITE_DONE or an error.
int openNextBlock(MessageCursor& cursor) {
  int code = SQLITE_ROW;
  while ((code = sqlite3_step(cursor.blocks)) == SQLITE_ROW) {
    const auto has = [keys = bytesOf(cursor.blocks, 1)](BlockKey key) {
      return mayHave(keys, key);
    };
    if (!std::all_of(cursor.wanted.begin(), cursor.wanted.end(), has)) continue;
    cursor.blockID = sqlite3_column_int64(cursor.blocks, 0);
    sqlite3_reset(cursor.block);
    sqlite3_bind_int64(cursor.block, 1, cursor.blockID);
    code = sqlite3_step(cursor.block);
    // A span may be left without a block. It has no records then.
    if (code == SQLITE_DONE) continue;
    if (code == SQLITE_ROW) {
      cursor.reader.open(bytesOf(cursor.block, 1), sqlite3_column_int64(cursor.block, 0));
    }
    return code;
  }
  return code;
}

// Moves to the next record of the table's kind.
int advance(sqlite3_vtab_cursor* base) {
  MessageCursor& cursor = cursorOf(base);
  const BlockRecordKind kind = *tableOf(cursor.pVtab).kind;
  try {
    while (true) {
      while (cursor.reader.next()) {
        if (cursor.reader.record().kind == kind) return SQLITE_OK;
      }
      if (cursor.reader.isDamaged()) {
        return fail(cursor, SQLITE_CORRUPT_VTAB, "a block of messages is damaged");
      }
      const int code = openNextBlock(cursor);
      if (code == SQLITE_ROW) continue;
      cursor.isAtEnd = true;
      return code == SQLITE_DONE ? SQLITE_OK : code;
    }
  } catch (const std::exception&) {
    return fail(cursor, SQLITE_NOMEM, "no memory for a block of messages");
  }
}

// Returns the key of an argument; std::nullopt if its type differs from the column's. SQLite may
// convert such a value, which then equals a value of the column although the two have different
// keys.
std::optional<BlockKey> keyOf(BlockKeyKind kind, sqlite3_value* value) {
  if (kind == BlockKeyKind::kSession) {
    if (sqlite3_value_type(value) != SQLITE_INTEGER) return std::nullopt;
    return sessionKey(sqlite3_value_int64(value));
  }
  if (sqlite3_value_type(value) != SQLITE_TEXT) return std::nullopt;
  const auto* const text = reinterpret_cast<const char*>(sqlite3_value_text(value));
  if (text == nullptr) return std::nullopt;
  return blockKey(kind, {text, static_cast<std::size_t>(sqlite3_value_bytes(value))});
}

int prepare(MessageCursor& cursor) {
  sqlite3* const database = tableOf(cursor.pVtab).database;
  sqlite3_finalize(std::exchange(cursor.blocks, nullptr));
  sqlite3_finalize(std::exchange(cursor.block, nullptr));
  // The first statement finds the blocks: by their spans, and the newest rows, which have no span.
  // The second statement reads one block, and only if it is wanted, because the blocks of a store
  // have a hundred times as many bytes as its spans.
  const int code = sqlite3_prepare_v2(
      database,
      "SELECT span, keys FROM main.message_spans WHERE last_time >= ?1 AND first_time <= ?2"
      " UNION ALL "
      "SELECT id, x'' FROM main.message_blocks"
      " WHERE id > (SELECT ifnull(max(span), -1) FROM main.message_spans) ORDER BY 1",
      -1, &cursor.blocks, nullptr);
  if (code != SQLITE_OK) return code;
  return sqlite3_prepare_v2(database,
                            "SELECT records, block FROM main.message_blocks WHERE id = ?1", -1,
                            &cursor.block, nullptr);
}

int filter(sqlite3_vtab_cursor* base, int number, const char* /*name*/, int /*count*/,
           sqlite3_value** arguments) {
  MessageCursor& cursor = cursorOf(base);
  const int code = prepare(cursor);
  if (code != SQLITE_OK) return code;
  const auto flags = static_cast<unsigned>(number);
  sqlite3_bind_double(cursor.blocks, 1, -std::numeric_limits<double>::infinity());
  sqlite3_bind_double(cursor.blocks, 2, std::numeric_limits<double>::infinity());
  if ((flags & kSince) != 0) sqlite3_bind_value(cursor.blocks, 1, *arguments++);
  if ((flags & kUntil) != 0) sqlite3_bind_value(cursor.blocks, 2, *arguments++);
  if ((flags & kAt) != 0) {
    sqlite3_bind_value(cursor.blocks, 1, *arguments);
    sqlite3_bind_value(cursor.blocks, 2, *arguments++);
  }
  cursor.wanted.clear();
  for (int column = 0; column < kKeyColumns; ++column) {
    if ((flags & kKeyOfColumn << static_cast<unsigned>(column)) == 0) continue;
    const auto kind = keyKindOf(*tableOf(cursor.pVtab).kind, column);
    const auto key = keyOf(*kind, *arguments++);
    if (key.has_value()) cursor.wanted.push_back(*key);
  }
  cursor.reader.open({}, 0);
  cursor.isAtEnd = false;
  return advance(base);
}

int isAtEnd(sqlite3_vtab_cursor* cursor) { return cursorOf(cursor).isAtEnd ? 1 : 0; }

void giveText(sqlite3_context* result, std::string_view text) {
  sqlite3_result_text64(result, text.data(), text.size(), SQLITE_TRANSIENT, SQLITE_UTF8);
}

int readColumn(sqlite3_vtab_cursor* base, sqlite3_context* result, int column) {
  MessageCursor& cursor = cursorOf(base);
  const BlockRecord& record = cursor.reader.record();
  if (column == kTimeColumn) {
    sqlite3_result_double(result, record.time);
    return SQLITE_OK;
  }
  if (record.kind == BlockRecordKind::kEvent) {
    giveText(result, column == 1                    ? record.name
                     : column == kApplicationColumn ? record.application
                                                    : record.payload);
    return SQLITE_OK;
  }
  switch (column) {
    case 1:
      sqlite3_result_int64(result, record.sessionID);
      break;
    case 2:
      giveText(result, record.clientName);
      break;
    case 3:
      giveText(result, record.serviceName);
      break;
    case 4:
      sqlite3_result_int64(result, record.category);
      break;
    case 5:
      sqlite3_result_int64(result, record.type);
      break;
    default:
      giveText(result, record.payload);
      break;
  }
  return SQLITE_OK;
}

int readNumber(sqlite3_vtab_cursor* base, sqlite3_int64* number) {
  MessageCursor& cursor = cursorOf(base);
  *number = cursor.blockID + cursor.reader.index();
  return SQLITE_OK;
}

// Because xCreate is null, each database has the table under the name of its module, without CREATE
// VIRTUAL TABLE.
const sqlite3_module kModule{.iVersion = 0,
                             .xCreate = nullptr,
                             .xConnect = connect,
                             .xBestIndex = chooseIndex,
                             .xDisconnect = disconnect,
                             .xDestroy = nullptr,
                             .xOpen = openCursor,
                             .xClose = closeCursor,
                             .xFilter = filter,
                             .xNext = advance,
                             .xEof = isAtEnd,
                             .xColumn = readColumn,
                             .xRowid = readNumber,
                             .xUpdate = nullptr,
                             .xBegin = nullptr,
                             .xSync = nullptr,
                             .xCommit = nullptr,
                             .xRollback = nullptr,
                             .xFindFunction = nullptr,
                             .xRename = nullptr,
                             .xSavepoint = nullptr,
                             .xRelease = nullptr,
                             .xRollbackTo = nullptr,
                             .xShadowName = nullptr};

}  // namespace

int addMessageTables(sqlite3* database) {
  static BlockRecordKind event = BlockRecordKind::kEvent;
  static BlockRecordKind link = BlockRecordKind::kLink;
  const int code = sqlite3_create_module(database, "halvox_events", &kModule, &event);
  return code == SQLITE_OK ? sqlite3_create_module(database, "halvox_links", &kModule, &link)
                           : code;
}

}  // namespace halvox::platform::linux_

#ifdef HALVOX_SQLITE_EXTENSION
extern "C" [[gnu::visibility("default")]] int sqlite3_extension_init(
    sqlite3* database, char** /*error*/, const sqlite3_api_routines* pApi) {
  SQLITE_EXTENSION_INIT2(pApi)
  return halvox::platform::linux_::addMessageTables(database);
}
#endif
