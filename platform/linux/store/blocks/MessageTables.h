#pragma once

struct sqlite3;

namespace halvox::platform::linux_ {

// Gives a connection the tables `halvox_events` and `halvox_links`, which unpack the rows of
// `message_blocks` in its database. The views analytics_events and link_messages need them.
//
//   halvox_events(time, name, payload), and hidden: application
//   halvox_links(time, session_id, client_name, service_name, category, type, payload)
//
// Rows come in the order of sending. A condition on the time skips blocks without unpacking them.
// So does one that compares for equality: of name or application, or of session_id, client_name or
// service_name. `application` is the HostApplicationDisplayID of the payload, or empty.
// A damaged block ends the query with an error. Returns an SQLite code.
//
// This is compiled twice: into programs, and into the extension that other programs load, which
// must call the SQLite that they have.
[[nodiscard]] int addMessageTables(sqlite3* database);

}  // namespace halvox::platform::linux_
