-- A store of schema version 1 with one event. Never change it: released stores look like this.
PRAGMA page_size = 8192; PRAGMA auto_vacuum = INCREMENTAL; PRAGMA journal_mode = WAL;
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
INSERT INTO event_names VALUES (1, 'com.tarno.test');
INSERT INTO analytics_records VALUES (1, 1700000000.0, 1, NULL, NULL, '{"number":1}');
INSERT INTO analytics_spans VALUES (0, 1700000000.0, 1700000000.0);
PRAGMA user_version = 1;
