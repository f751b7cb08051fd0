#pragma once

#include <string>
#include <string_view>

#include "platform/property_list.h"
#include "tracing/TraceParams.h"

namespace halvox {

// Keys and values of a trace parameters file. The constants' names are part of the interface.
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

// Reads a property-list file that describes a trace.
//
// It never gives up: what is missing or wrong is logged, and reading continues with the rest.
// Clients name the file: any content is possible. Belongs to one thread; blocks while it reads
// the disk.
//
// Nested values are read as if each had been printed and parsed again, which turns all scalars into
// texts. This peculiar rule is part of the interface. Its effect on each kind of value:
//
//   text          itself
//   number        its decimal text: 42 as a code is hexadecimal 42; a boolean is "1" or "0"
//   date, data    the text that describes it, which is never a code, a name or a list
//   array,        the same with texts inside; where a text is expected, its description
//   dictionary
//   nothing       the text "(null)", which is neither an array nor a dictionary
//
// A missing name is therefore "(null)". A missing code is 0, because "(" is not a hexadecimal
// digit. A missing list, or a value of another kind in its place, is an empty list. An element that
// is not a dictionary is an empty dictionary.
class TraceParamsParser {
 public:
  // Receives what is found while a file is read, in the order of the file.
  class Listener {
   public:
    Listener() = default;
    Listener(const Listener&) = delete;
    Listener& operator=(const Listener&) = delete;
    virtual ~Listener() = default;
    // Something is missing or wrong. `sentence` is the text of the log line.
    virtual void onError(const std::string& sentence) = 0;
    // A trace point with its codes as they are in the file.
    virtual void onTracePoint(const TraceDataParams& point) = 0;
  };

  explicit TraceParamsParser(std::string fileName) : traceParamsFile_(std::move(fileName)) {}

  [[nodiscard]] const std::string& traceParamsFile() const { return traceParamsFile_; }
  // The content of the file; without trace points if there is nothing to read. A relative name
  // starts from the current directory of the process.
  [[nodiscard]] TraceParams loadTraceParams() const;
  // The same for a program that has not installed the services, such as halvoxctl. The listener
  // receives what the service would log.
  [[nodiscard]] TraceParams loadTraceParams(const platform::PropertyListService& lists,
                                            Listener& listener) const;

 private:
  const std::string traceParamsFile_;
};

}  // namespace halvox
