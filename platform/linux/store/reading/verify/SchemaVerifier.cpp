#include "platform/linux/store/reading/verify/SchemaVerifier.h"

#include <map>
#include <string>

#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

// The definitions by kind and name, such as "view losses".
using Definitions = std::map<std::string, std::string>;

SqliteCode readDefinitions(Database& database, Definitions& definitions) {
  Statement statement;
  // Names that begin with sqlite_ are SQLite's own, such as the statistics that ANALYZE makes.
  SqliteCode code = database.prepare(
      "SELECT type || ' ' || name, ifnull(sql, '') FROM sqlite_schema"
      " WHERE name NOT LIKE 'sqlite\\_%' ESCAPE '\\'",
      statement);
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = statement.step();
    if (code == SQLITE_ROW) definitions.emplace(statement.text(0), statement.text(1));
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

}  // namespace

SqliteCode verifySchema(Database& database, std::int64_t version, Differences& differences,
                        bool& hasTables) {
  Definitions found;
  Definitions expected;
  Database model;
  SqliteCode code = model.open(":memory:", DatabaseAccess::kReadWrite);
  if (code == SQLITE_OK) code = migrateTo(model, version);
  if (code == SQLITE_OK) code = readDefinitions(model, expected);
  if (code == SQLITE_OK) code = readDefinitions(database, found);
  if (code != SQLITE_OK) return code;
  hasTables = true;
  for (const auto& [object, definition] : expected) {
    const auto present = found.find(object);
    const bool isRight = present != found.end() && present->second == definition;
    if (!isRight && object.starts_with("table ")) hasTables = false;
    if (present == found.end()) {
      differences.add("the schema", object, "is missing");
    } else if (!isRight) {
      differences.add("the schema", object,
                      "has another definition than version " + std::to_string(version) + " has");
    }
  }
  for (const auto& [object, definition] : found) {
    if (expected.contains(object)) continue;
    differences.add("the schema", object, "does not belong to version " + std::to_string(version));
  }
  return SQLITE_OK;
}

}  // namespace halvox::platform::linux_
