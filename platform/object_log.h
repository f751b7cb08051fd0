#pragma once

#include <string_view>

#include "platform/log.h"

namespace halvox::platform {

// Writes the log lines of one object. It has the category that the object received when it was
// made, and the name of the object's unit. An object that receives the log service as an argument
// has an ObjectLog as a member. A UnitLog would be wrong there, because a unit looks its category
// up once for the life of the process.
//
//   log_.info("watching ", directory);
//
// Copies are cheap. Any thread may use it. The log service owns the category and must outlive every
// copy.
class ObjectLog {
 public:
  // `unit` is not copied. Pass a constant.
  ObjectLog(LogCategory& category, std::string_view unit) : category_(&category), unit_(unit) {}

  template <typename... Parts>
  void debug(const UnitLog::Text& text, const Parts&... parts) const {
    UnitLog::logTo(*category_, unit_, LogLevel::kDebug, text, parts...);
  }
  template <typename... Parts>
  void info(const UnitLog::Text& text, const Parts&... parts) const {
    UnitLog::logTo(*category_, unit_, LogLevel::kInfo, text, parts...);
  }
  template <typename... Parts>
  void notice(const UnitLog::Text& text, const Parts&... parts) const {
    UnitLog::logTo(*category_, unit_, LogLevel::kDefault, text, parts...);
  }
  template <typename... Parts>
  void error(const UnitLog::Text& text, const Parts&... parts) const {
    UnitLog::logTo(*category_, unit_, LogLevel::kError, text, parts...);
  }
  // Logs a line at a level that the caller chooses.
  template <typename... Parts>
  void log(LogLevel level, const UnitLog::Text& text, const Parts&... parts) const {
    UnitLog::logTo(*category_, unit_, level, text, parts...);
  }

 private:
  LogCategory* category_;
  std::string_view unit_;
};

}  // namespace halvox::platform
