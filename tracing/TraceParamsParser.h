#pragma once

#include <string>
#include <string_view>

#include "platform/property_list.h"
#include "tracing/TraceParams.h"

namespace halvox {

// Keys and values of a trace parameters file.
inline constexpr std::string_view TraceParamChildrenNodes = "Children";
inline constexpr std::string_view TraceDataDescription = "Name";
inline constexpr std::string_view TraceDataType = "TraceType";
inline constexpr std::string_view TraceDataTypekTrace = "ktrace";
inline constexpr std::string_view TraceDataTypeOSSignpost = "OSSignpost";
inline constexpr std::string_view TraceDataIsCritical = "IsCritical";  // not read
inline constexpr std::string_view TraceDataChildrenNodes = "Children";
inline constexpr std::string_view TracePointDescription = "Name";
inline constexpr std::string_view TracePointType = "Type";
inline constexpr std::string_view TracePointTypeInterval = "Interval";
inline constexpr std::string_view TracePointTypeImpulse = "Impulse";
inline constexpr std::string_view TracePointTypeLevel = "Level";
inline constexpr std::string_view TracePointBeginCode = "KTraceCodeBegin";
inline constexpr std::string_view TracePointEndCode = "KTraceCodeEnd";
inline constexpr std::string_view TracePointEventsMatchedBy = "EventsMatchedBy";
inline constexpr std::string_view TracePointEventsMatchedByThread = "Thread";
inline constexpr std::string_view TracePointEventsMatchedByProcess = "Process";

// Reads a property-list file that describes a trace. Never gives up: what is missing or wrong is
// logged, and reading goes on with what there is. Belongs to one thread; waits for the disk.
//
// Nested values count as if they had been printed and read again, which leaves texts in the place
// of all scalars. What that makes of each kind of value:
//
//   text          itself
//   number        its decimal text: 42 as a code is hexadecimal 42; a boolean is "1" or "0"
//   date, data    the text that describes it; no code, name or list of anything
//   array,        the same with texts inside; as a text where one is expected, its description
//   dictionary
//   nothing       the text "(null)", which is neither an array nor a dictionary
//
// So a missing name is "(null)", a missing code 0 ("(" is no hexadecimal digit), a missing list or
// one of another kind holds nothing, and a list's element that is no dictionary is one with no
// keys.
class TraceParamsParser {
 public:
  // What is found while a file is read, in its order.
  class Listener {
   public:
    Listener() = default;
    Listener(const Listener&) = delete;
    Listener& operator=(const Listener&) = delete;
    virtual ~Listener() = default;
    // Something is missing or wrong; the sentence that the log has.
    virtual void onError(const std::string& sentence) = 0;
    // A trace point, with its codes as they stand in the file.
    virtual void onTracePoint(const TraceDataParams& point) = 0;
  };

  explicit TraceParamsParser(std::string fileName) : traceParamsFile_(std::move(fileName)) {}

  [[nodiscard]] const std::string& traceParamsFile() const { return traceParamsFile_; }
  // What the file says; no trace points when it says nothing. A relative name starts from the
  // process's current directory.
  [[nodiscard]] TraceParams loadTraceParams() const;
  // The same for a program without the installed services: the listener gets what would be logged.
  [[nodiscard]] TraceParams loadTraceParams(const platform::PropertyListService& lists,
                                            Listener& listener) const;

 private:
  const std::string traceParamsFile_;
};

}  // namespace halvox
