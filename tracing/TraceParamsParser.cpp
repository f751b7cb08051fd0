#include "tracing/TraceParamsParser.h"

#include <charconv>
#include <optional>

#include "platform/property_list.h"
#include "platform/services.h"
#include "tracing/TraceLog.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::Value;

constexpr platform::UnitLog kLog(&HVReportingTraceCategory, "TraceParamsParser");

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

// What is wrong with a value that should be a container.
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

Array children(const Dictionary& parent, std::string_view key, const char* failure) {
  const Value* value = parent.find(key);
  if (value != nullptr && value->isArray()) return value->array();
  kLog.error(failure, kindError(value, "an array"));
  return {};
}

Dictionary element(const Value& value, const char* failure) {
  if (value.isDictionary()) return value.dictionary();
  kLog.error(failure, kindError(&value, "a dictionary"));
  return {};
}

// Reads as many hexadecimal digits as there are from the start, after a "0x" if there is one.
// Without a digit 0, and of too large a number the largest.
std::uint32_t scanHexadecimal(std::string_view text) {
  constexpr int kHexadecimal = 16;
  if (text.starts_with("0x") || text.starts_with("0X")) text.remove_prefix(2);
  std::uint32_t code = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), code, kHexadecimal);
  return result.ec == std::errc::result_out_of_range ? UINT32_MAX : code;
}

// The dictionary that the file holds.
Dictionary readRoot(const std::string& path) {
  std::optional<Error> error;
  const auto& lists = platform::propertyLists();
  const auto bytes = lists.readFile(path, error);
  if (!bytes.has_value()) kLog.error(kReadingFailed, shown(error));
  error.reset();
  const auto root = lists.parse(bytes, error);
  if (!root.has_value()) {
    kLog.error(kReadingFailed, shown(error));
    kLog.error("No valid input found in plist.");
    return {};
  }
  return root->dictionary();
}

// Reads trace points one after the other. One of an unknown type is taken for one of the type
// before it, with its own codes: that is intended.
class TracePointReader {
 public:
  TraceDataParams read(const Dictionary& point) {
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
    kLog.info("Loading tracepoint : ", static_cast<std::int32_t>(params.beginCode), " and ",
              static_cast<std::int32_t>(params.endCode), " \n finished parsing.");
    if (kind_ == TracePointKind::kImpulse) params.endCode = params.beginCode;
    return params;
  }

 private:
  void readKind(const Dictionary& point) {
    const std::string type = textOf(point, TracePointType);
    if (type == TracePointTypeInterval) {
      kind_ = TracePointKind::kInterval;
    } else if (type == TracePointTypeImpulse) {
      kind_ = TracePointKind::kImpulse;
    } else if (type == TracePointTypeLevel) {
      kind_ = TracePointKind::kLevel;
    } else {
      kLog.error("TracePointType field not recognized or is empty.");
    }
  }

  TracePointKind kind_ = TracePointKind::kImpulse;
};

void readTrace(const Dictionary& trace, TracePointReader& reader, TraceParams& params) {
  if (params.name.empty()) {
    params.name = textOf(trace, TraceDataDescription);
    if (params.name.empty()) kLog.error("Description not found in the plist file");
  }
  if (params.type == TraceType::kKernelTrace &&
      textOf(trace, TraceDataType) == TraceDataTypeOSSignpost) {
    params.type = TraceType::kSignpost;
  }
  for (const Value& point : children(trace, TraceDataChildrenNodes, kPointsFailed)) {
    params.tracePoints.push_back(reader.read(element(point, kPointFailed)));
  }
}

}  // namespace

TraceParams TraceParamsParser::loadTraceParams() const {
  std::string path = traceParamsFile_;
  if (!path.starts_with('/')) {
    path.insert(0, platform::propertyLists().currentDirectory() + "/");
  }
  const Dictionary root = readRoot(path);
  TraceParams params;
  TracePointReader reader;
  for (const Value& trace : children(root, TraceParamChildrenNodes, kTracesFailed)) {
    readTrace(element(trace, kTraceFailed), reader, params);
  }
  return params;
}

}  // namespace halvox
