#include "tracing/TraceParamsParser.h"

#include <charconv>
#include <optional>
#include <utility>

#include "platform/services.h"
#include "tracing/TraceLog.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::Value;

constexpr platform::UnitLog kLog(&HVReportingTraceCategory, "TraceParamsParser");

// One text for reading and for parsing; both are part of the interface.
constexpr const char* kReadingFailed = "Reading from plist file failed with error: ";
constexpr const char* kTracesFailed = "Failed to load Trace Parameter Array with error: ";
constexpr const char* kTraceFailed = "Failed to load Trace Parameter dictionary with error : ";
constexpr const char* kPointsFailed =
    "Failed to read the Trace Points from the plist file with error: ";
constexpr const char* kPointFailed =
    "Failed to read Trace Point from Trace Points dictionary. Failed with error: ";

constexpr std::string_view kNothing = "(null)";

std::string shown(const std::optional<Error>& error) {
  return error.has_value() ? error->description : std::string(kNothing);
}

std::string textOf(const Dictionary& dictionary, std::string_view key) {
  const Value* value = dictionary.find(key);
  return value == nullptr ? std::string(kNothing) : platform::describe(*value);
}

// Describes a value that should be a container.
std::string kindError(const Value* value, std::string_view expected) {
  std::string text = "expected " + std::string(expected) + ", found ";
  if (value == nullptr) return text += kNothing;
  switch (value->kind()) {
    case platform::ValueKind::kNone:
      return text += kNothing;
    case platform::ValueKind::kNumber:
      return text += "a number";
    case platform::ValueKind::kString:
      return text += "a string";
    case platform::ValueKind::kDate:
      return text += "a date";
    case platform::ValueKind::kData:
      return text += "data";
    case platform::ValueKind::kArray:
      return text += "an array";
    case platform::ValueKind::kDictionary:
      return text += "a dictionary";
  }
  return text;
}

// The hexadecimal number at the start of the text, with or without "0x". 0 if there is no digit;
// the largest number if there are too many digits.
std::uint32_t scanHexadecimal(std::string_view text) {
  constexpr int kHexadecimal = 16;
  if (text.starts_with("0x") || text.starts_with("0X")) text.remove_prefix(2);
  std::uint32_t code = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), code, kHexadecimal);
  return result.ec == std::errc::result_out_of_range ? UINT32_MAX : code;
}

// Reads one file. A trace point of an unknown type takes the type of the trace point before it,
// with its own codes; this carry-over is required.
class FileReader {
 public:
  FileReader(const platform::PropertyListService& lists, TraceParamsParser::Listener& listener)
      : lists_(lists), listener_(listener) {}

  TraceParams read(const std::string& path) {
    const Dictionary root = readRoot(path);
    for (const Value& trace : children(root, TraceParamChildrenNodes, kTracesFailed)) {
      readTrace(element(trace, kTraceFailed));
    }
    return std::move(params_);
  }

 private:
  void report(const char* what, const std::string& why) { listener_.onError(what + why); }

  // The dictionary at the root of the file; empty after a failure. Parsing is tried even without
  // bytes, because its failure is logged as well.
  Dictionary readRoot(const std::string& path) {
    std::optional<Error> error;
    const auto bytes = lists_.readFile(path, error);
    if (!bytes.has_value()) report(kReadingFailed, shown(error));
    error.reset();
    const auto root = lists_.parse(bytes, error);
    if (!root.has_value()) {
      report(kReadingFailed, shown(error));
      listener_.onError("No valid input found in plist.");
      return {};
    }
    return root->dictionary();
  }

  Array children(const Dictionary& parent, std::string_view key, const char* failure) {
    const Value* value = parent.find(key);
    if (value != nullptr && value->isArray()) return value->array();
    report(failure, kindError(value, "an array"));
    return {};
  }

  Dictionary element(const Value& value, const char* failure) {
    if (value.isDictionary()) return value.dictionary();
    report(failure, kindError(&value, "a dictionary"));
    return {};
  }

  void readTrace(const Dictionary& trace) {
    // The first trace that has a name gives the record its name. The first signpost gives the
    // record its type.
    if (params_.name.empty()) {
      params_.name = textOf(trace, TraceDataDescription);
      if (params_.name.empty()) listener_.onError("Description not found in the plist file");
    }
    if (params_.type == TraceType::kKernelTrace &&
        textOf(trace, TraceDataType) == TraceDataTypeOSSignpost) {
      params_.type = TraceType::kSignpost;
    }
    for (const Value& point : children(trace, TraceDataChildrenNodes, kPointsFailed)) {
      params_.tracePoints.push_back(readPoint(element(point, kPointFailed)));
    }
  }

  TraceDataParams readPoint(const Dictionary& point) {
    TraceDataParams params;
    params.name = textOf(point, TracePointDescription);
    params.matchByThread =
        textOf(point, TracePointEventsMatchedBy) == TracePointEventsMatchedByThread;
    readKind(point);
    params.kind = kind_;
    params.beginCode = scanHexadecimal(textOf(point, TracePointBeginCode));
    if (kind_ == TracePointKind::kInterval) {
      params.endCode = scanHexadecimal(textOf(point, TracePointEndCode));
    }
    // Reported before an impulse gets its end code, because the log line must show the codes of the
    // file.
    listener_.onTracePoint(params);
    if (kind_ == TracePointKind::kImpulse) params.endCode = params.beginCode;
    return params;
  }

  void readKind(const Dictionary& point) {
    const std::string type = textOf(point, TracePointType);
    if (type == TracePointTypeInterval) {
      kind_ = TracePointKind::kInterval;
    } else if (type == TracePointTypeImpulse) {
      kind_ = TracePointKind::kImpulse;
    } else if (type == TracePointTypeLevel) {
      kind_ = TracePointKind::kLevel;
    } else {
      listener_.onError("TracePointType field not recognized or is empty.");
    }
  }

  const platform::PropertyListService& lists_;
  TraceParamsParser::Listener& listener_;
  TraceParams params_;
  TracePointKind kind_ = TracePointKind::kImpulse;  // of the latest trace point
};

class LoggingListener final : public TraceParamsParser::Listener {
 public:
  void onError(const std::string& sentence) override { kLog.error("", sentence); }
  void onTracePoint(const TraceDataParams& point) override {
    // Signed numbers and the line break are part of the interface.
    kLog.info("Loading tracepoint : ", static_cast<std::int32_t>(point.beginCode), " and ",
              static_cast<std::int32_t>(point.endCode), " \n finished parsing.");
  }
};

}  // namespace

TraceParams TraceParamsParser::loadTraceParams() const {
  LoggingListener listener;
  return loadTraceParams(platform::propertyLists(), listener);
}

TraceParams TraceParamsParser::loadTraceParams(const platform::PropertyListService& lists,
                                               Listener& listener) const {
  std::string path = traceParamsFile_;
  if (!path.starts_with('/')) path.insert(0, lists.currentDirectory() + "/");
  return FileReader(lists, listener).read(path);
}

}  // namespace halvox
