#pragma once

struct sqlite3;

namespace halvox::platform::linux_ {

// Adds the tables `halvox_events` and `halvox_links` to a connection. They unpack the rows of
// `message_blocks` in its database. The views analytics_events and link_messages need them.
//
//   halvox_events(time, name, payload), and hidden: application
//   halvox_links(time, session_id, client_name, service_name, category, type, payload)
//
// Rows come in the order of sending. A query skips blocks without unpacking them if it has a
// condition on the time, or tests one of these columns for equality: name and application, or
// session_id, client_name and service_name. `application` is the HostApplicationDisplayID of the
// payload, or empty.
// A damaged block ends the query with an error. Returns an SQLite code.
//
// This code is compiled twice: for the programs of this system, and for the extension. The
// extension must call the SQLite of the program that loads it.
[[nodiscard]] int addMessageTables(sqlite3* database);

}  // namespace halvox::platform::linux_
