#include "platform/linux/store/StoreSchema.h"

#include <array>
#include <string>

namespace halvox::platform::linux_ {
namespace {

// One record holds the two events that a message makes, because their payloads are equal: half the
// bytes and half the inserts. A record of one event has no twin. Record numbers only grow.
//
// There is no index on the time; analytics_spans holds the first and the last time of each 512
// records instead, which costs nothing per event and serves ranges of time and retention as well.
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

// The kinds of record that are written as they come, each with its times as above.
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

// Step number n leads from version n to version n + 1. Steps that were released stay as they are.
constexpr std::array kMigrations{kAnalyticsEvents, kOtherRecords};

}  // namespace

const std::int64_t kStoreSchemaVersion = kMigrations.size();

SqliteCode migrate(Database& database) {
  const std::int64_t present = database.queryInteger("PRAGMA user_version").value_or(0);
  for (auto step = static_cast<std::size_t>(present); step < kMigrations.size(); ++step) {
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
