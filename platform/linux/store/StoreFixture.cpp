#include "platform/linux/store/StoreFixture.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <ostream>
#include <random>

#include "platform/linux/store/blocks/MessageTables.h"

namespace halvox::platform::linux_ {

std::vector<std::string> rows(const std::filesystem::path& database, std::string_view sql) {
  Database connection;
  Statement statement;
  std::vector<std::string> result;
  if (connection.open(database, DatabaseAccess::kReadOnly) != SQLITE_OK ||
      addMessageTables(connection.get()) != SQLITE_OK ||
      connection.prepare(sql, statement) != SQLITE_OK) {
    return {"error: " + connection.errorText()};
  }
  sqlite3_busy_timeout(connection.get(), 5000);
  SqliteCode code = SQLITE_ROW;
  while ((code = statement.step()) == SQLITE_ROW) {
    std::string row;
    for (int column = 0; column < statement.columns(); ++column) {
      if (column > 0) row += '|';
      row += statement.text(column);
    }
    result.push_back(row);
  }
  if (code != SQLITE_DONE) result.push_back("error: " + connection.errorText());
  return result;
}

void execute(const std::filesystem::path& database, const std::string& sql) {
  Database connection;
  ASSERT_EQ(connection.open(database, DatabaseAccess::kReadWrite), SQLITE_OK);
  ASSERT_EQ(connection.execute(sql), SQLITE_OK) << connection.errorText();
}

std::string readFile(const std::filesystem::path& path) {
  std::ifstream stream(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), {}};
}

void writeFile(const std::filesystem::path& path, std::string_view content) {
  std::filesystem::create_directories(path.parent_path());
  std::ofstream stream(path, std::ios::binary | std::ios::trunc);
  stream << content;
}

Result<void, StoreError> StoreFixture::open() {
  service.reset();
  store.reset();
  store = std::make_unique<SqliteStore>(
      options, SqliteStore::Environment{platform.clock, platform.statistics, backpressure});
  service = std::make_unique<SqliteAnalyticsService>(*store, platform.clock);
  return store->open();
}

void StoreFixture::send(std::int64_t number, const std::string& name) {
  service->sendAnalyticsEventLazy(name, [number] { return Dictionary{{"number", number}}; });
}

void StoreFixture::sendAt(double time, std::int64_t number) {
  platform.clock.setCurrentDate({time});
  send(number);
}

void StoreFixture::sendLong(std::int64_t count) {
  for (std::int64_t number = 0; number < count; ++number) {
    service->sendAnalyticsEventLazy("long", [number] {
      return Dictionary{{"n", number}, {"f", noise(static_cast<std::uint64_t>(number), 480)}};
    });
  }
}

bool StoreFixture::allIsStored() {
  return eventually([this] { return store->waiting() == 0; });
}

std::vector<std::filesystem::path> StoreFixture::setAsideFiles() const {
  std::vector<std::filesystem::path> found;
  for (const auto& entry : std::filesystem::directory_iterator(options.directory)) {
    if (entry.path().filename().native().starts_with("halvox.db.damaged-")) {
      found.push_back(entry.path());
    }
  }
  std::ranges::sort(found);
  return found;
}

std::uint64_t StoreFixture::dropped() const {
  std::uint64_t sum = 0;
  for (const auto& [name, count] : platform.statistics.values("analytics")) {
    if (name.starts_with("dropped")) sum += count;
  }
  return sum;
}

std::string numbered(std::int64_t number) { return "{\"number\":" + std::to_string(number) + "}"; }

std::string noise(std::uint64_t number, std::size_t length) {
  constexpr std::string_view kAlphabet =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
  std::mt19937_64 random(number);
  std::string text;
  while (text.size() < length) text += kAlphabet[random() % kAlphabet.size()];
  return text;
}

}  // namespace halvox::platform::linux_
