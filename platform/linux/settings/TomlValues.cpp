#include "platform/linux/settings/TomlValues.h"

#include <array>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <string>
#include <vector>

namespace halvox::platform::linux_ {
namespace {

using Seconds = std::chrono::duration<double>;

double secondsInUTC(const toml::date& date, const toml::time& time) {
  const std::chrono::year_month_day day{std::chrono::year(date.year),
                                        std::chrono::month(date.month), std::chrono::day(date.day)};
  const auto whole = std::chrono::sys_days(day) + std::chrono::hours(time.hour) +
                     std::chrono::minutes(time.minute) + std::chrono::seconds(time.second);
  return Seconds(whole.time_since_epoch()).count();
}

double secondsInLocalTime(const toml::date& date, const toml::time& time) {
  std::tm fields{};
  fields.tm_year = date.year - 1900;
  fields.tm_mon = date.month - 1;
  fields.tm_mday = date.day;
  fields.tm_hour = time.hour;
  fields.tm_min = time.minute;
  fields.tm_sec = time.second;
  fields.tm_isdst = -1;  // the C library finds out whether daylight saving time applies
  return static_cast<double>(std::mktime(&fields));
}

Date toDate(const toml::date& date, const toml::time& time, const toml::time_offset* offset) {
  const double whole = offset == nullptr ? secondsInLocalTime(date, time)
                                         : secondsInUTC(date, time) - offset->minutes * 60.0;
  return {whole + Seconds(std::chrono::nanoseconds(time.nanosecond)).count()};
}

std::string toText(const toml::time& time) {
  std::array<char, 48> text{};
  int length = std::snprintf(text.data(), text.size(), "%02u:%02u:%02u", unsigned{time.hour},
                             unsigned{time.minute}, unsigned{time.second});
  if (time.nanosecond != 0) {
    length += std::snprintf(text.data() + length, text.size() - static_cast<std::size_t>(length),
                            ".%09u", unsigned{time.nanosecond});
    while (text[static_cast<std::size_t>(length) - 1] == '0') --length;
  }
  return {text.data(), static_cast<std::size_t>(length)};
}

}  // namespace

Value toValue(const toml::node& node) {
  if (const auto* text = node.as_string()) return std::string_view(text->get());
  if (const auto* number = node.as_integer()) return number->get();
  if (const auto* number = node.as_floating_point()) return number->get();
  if (const auto* flag = node.as_boolean()) return flag->get();
  if (const auto* table = node.as_table()) return toDictionary(*table);
  // Property lists have no time without a date.
  if (const auto* time = node.as_time()) return toText(time->get());
  if (const auto* date = node.as_date()) return toDate(date->get(), {}, nullptr);
  if (const auto* moment = node.as_date_time()) {
    const auto& offset = moment->get().offset;
    return toDate(moment->get().date, moment->get().time, offset ? &*offset : nullptr);
  }
  std::vector<Value> values;
  if (const toml::array* array = node.as_array()) {
    values.reserve(array->size());
    for (const toml::node& element : *array) values.push_back(toValue(element));
  }
  return Array(values);
}

Dictionary toDictionary(const toml::table& table) {
  Dictionary dictionary;
  dictionary.reserve(table.size());
  for (const auto& [key, node] : table) dictionary.set(key.str(), toValue(node));
  return dictionary;
}

}  // namespace halvox::platform::linux_
