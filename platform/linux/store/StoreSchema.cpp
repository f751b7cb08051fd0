#include "platform/linux/store/StoreSchema.h"

#include <array>
#include <string>

namespace halvox::platform::linux_ {
namespace {

// A message makes two events with equal payloads. One record holds both events, which halves the
// bytes and the inserts. In the record of a single event the twin columns are NULL. Record numbers
// only grow.
//
// The time has no index, because an index would raise SQLite's CPU time per message from 2.2 to 3.0
// us. Instead, analytics_spans holds the first and the last time of every 512 records. It is
// written once for each transaction and once for every 512 records. Readers use it to find a range
// of time, and retention to find expired records.
//
// The view uses CROSS JOIN because SQLite does not reorder the tables of such a join. The rows
// therefore come in the order in which the events were sent, without a sort.
constexpr std::string_view kAnalyticsEvents = R"sql(
CREATE TABLE event_names(
  id INTEGER PRIMARY KEY,
  name TEXT NOT NULL UNIQUE);
CREATE TABLE analytics_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  name_id INTEGER NOT NULL,
  twin_time REAL,
  twin_name_id INTEGER,
  payload TEXT NOT NULL);
CREATE TABLE analytics_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW analytics_events(time, name, payload) AS
SELECT CASE which.twin WHEN 0 THEN record.time ELSE record.twin_time END,
       event_names.name,
       record.payload
FROM analytics_records AS record
CROSS JOIN (SELECT 0 AS twin UNION ALL SELECT 1) AS which
CROSS JOIN event_names
  ON event_names.id = CASE which.twin WHEN 0 THEN record.name_id ELSE record.twin_name_id END;
)sql";

// The other kinds of records, with a row for each record and a table of spans as above. Other
// programs read the views, and the next version can therefore change the tables.
constexpr std::string_view kOtherRecords = R"sql(
CREATE TABLE issue_metric_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  metric_id INTEGER NOT NULL,
  message BLOB NOT NULL);
CREATE TABLE issue_metric_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW issue_metrics(time, metric_id, message) AS
SELECT time, metric_id, message FROM issue_metric_records;

CREATE TABLE power_event_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  category_id INTEGER NOT NULL,
  event_name TEXT NOT NULL,
  payload TEXT NOT NULL);
CREATE TABLE power_event_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW power_events(time, category_id, event_name, payload) AS
SELECT time, category_id, event_name, payload FROM power_event_records;

CREATE TABLE link_message_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  session_id INTEGER NOT NULL,
  client_name TEXT NOT NULL,
  service_name TEXT NOT NULL,
  category INTEGER NOT NULL,
  type INTEGER NOT NULL,
  payload TEXT NOT NULL);
CREATE TABLE link_message_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW link_messages(time, session_id, client_name, service_name, category, type, payload) AS
SELECT time, session_id, client_name, service_name, category, type, payload
FROM link_message_records;

CREATE TABLE snapshot_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  signature TEXT NOT NULL,
  path TEXT NOT NULL);
CREATE TABLE snapshot_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW snapshots(time, signature, path) AS
SELECT time, signature, path FROM snapshot_records;
)sql";

// Events and link messages of earlier versions stay in their tables until retention deletes them,
// because moving them would take minutes. New ones go into blocks, and the views show both. The
// tables halvox_events and halvox_links unpack the blocks. The programs of this system have these
// two tables built in; other programs load halvox-sqlite.so to get them.
//
// message_blocks.id is the number of the block's first record. Numbers continue after those of the
// old tables. In the old tables, the events of record n have the numbers 2n and 2n + 1, and a link
// message has the number of its record. The INSERT adds a block without records. Its ID is the
// first free number.
//
// message_spans has one row for each sealed block, with the same number as the block. Its keys say
// which sessions, applications and names occur in the block (blocks/BlockKeys.h).
constexpr std::string_view kMessageBlocks = R"sql(
CREATE TABLE message_blocks(
  id INTEGER PRIMARY KEY,
  records INTEGER NOT NULL,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL,
  block BLOB NOT NULL);
CREATE TABLE message_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL,
  keys BLOB NOT NULL);
INSERT INTO message_blocks
SELECT next, 0, 0, 0, x''
FROM (SELECT 1 + max(
        2 * max(ifnull((SELECT max(id) FROM analytics_records), 0),
                ifnull((SELECT 512 * (max(span) + 1) FROM analytics_spans), 0)) + 1,
        ifnull((SELECT max(id) FROM link_message_records), 0),
        ifnull((SELECT 512 * (max(span) + 1) FROM link_message_spans), 0)) AS next)
WHERE next > 2;
DROP VIEW analytics_events;
CREATE VIEW analytics_events(time, name, payload) AS
SELECT CASE which.twin WHEN 0 THEN record.time ELSE record.twin_time END,
       event_names.name,
       record.payload
FROM analytics_records AS record
CROSS JOIN (SELECT 0 AS twin UNION ALL SELECT 1) AS which
CROSS JOIN event_names
  ON event_names.id = CASE which.twin WHEN 0 THEN record.name_id ELSE record.twin_name_id END
UNION ALL
SELECT time, name, payload FROM halvox_events;
DROP VIEW link_messages;
CREATE VIEW link_messages(time, session_id, client_name, service_name, category, type, payload) AS
SELECT time, session_id, client_name, service_name, category, type, payload
FROM link_message_records
UNION ALL
SELECT time, session_id, client_name, service_name, category, type, payload FROM halvox_links;
)sql";

// What the service counted as dropped, suppressed or refused since its last row of that piece and
// reason. It writes such rows at most once a minute and at its end, only for counts that have
// grown.
constexpr std::string_view kLosses = R"sql(
CREATE TABLE loss_records(
  id INTEGER PRIMARY KEY,
  time REAL NOT NULL,
  piece TEXT NOT NULL,
  reason TEXT NOT NULL,
  count INTEGER NOT NULL);
CREATE TABLE loss_spans(
  span INTEGER PRIMARY KEY,
  first_time REAL NOT NULL,
  last_time REAL NOT NULL);
CREATE VIEW losses(time, piece, reason, count) AS
SELECT time, piece, reason, count FROM loss_records;
)sql";

// The runs of the service (ServiceRuns.h). `ending` is NULL while a run lasts.
constexpr std::string_view kRuns = R"sql(
CREATE TABLE run_records(
  id INTEGER PRIMARY KEY,
  boot_id TEXT NOT NULL,
  start_time REAL NOT NULL,
  last_commit REAL NOT NULL,
  ending TEXT);
CREATE VIEW runs(run, start, last_commit, ending) AS
SELECT id, start_time, last_commit, ending FROM run_records;
)sql";

// Messages of the link that no server has acknowledged (spool/SpooledMessages.h). `first` is the
// number of the row's first message, `sent` how many of its first messages were acknowledged.
constexpr std::string_view kLinkSpool = R"sql(
CREATE TABLE link_spool(
  first INTEGER PRIMARY KEY,
  messages INTEGER NOT NULL,
  sent INTEGER NOT NULL,
  time REAL NOT NULL,
  block BLOB NOT NULL);
)sql";

// Step n migrates from version n to version n + 1. Never change a step that was released, because
// stores that have already applied it would differ from new ones.
constexpr std::array kMigrations{kAnalyticsEvents, kOtherRecords, kMessageBlocks,
                                 kLosses,          kRuns,         kLinkSpool};

}  // namespace

const std::int64_t kStoreSchemaVersion = kMigrations.size();

SqliteCode migrate(Database& database) { return migrateTo(database, kStoreSchemaVersion); }

SqliteCode migrateTo(Database& database, std::int64_t version) {
  const std::int64_t present = database.queryInteger("PRAGMA user_version").value_or(0);
  for (auto step = static_cast<std::size_t>(present); step < static_cast<std::size_t>(version);
       ++step) {
    // Change the version in the transaction of its step. No step can then be applied twice or in
    // part.
    const SqliteCode code =
        database.execute("BEGIN IMMEDIATE;" + std::string(kMigrations[step]) +
                         "PRAGMA user_version = " + std::to_string(step + 1) + "; COMMIT");
    if (code != SQLITE_OK) {
      static_cast<void>(database.execute("ROLLBACK"));
      return code;
    }
  }
  return SQLITE_OK;
}

}  // namespace halvox::platform::linux_
