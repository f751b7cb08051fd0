#include "tools/export/testing/PerfettoText.h"

#include <array>
#include <cstdint>

#include <protozero/pbf_reader.hpp>

#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

using protozero::pbf_reader;

std::string trackText(std::uint64_t uuid) {
  constexpr std::uint64_t kNumbers = (std::uint64_t{1} << 60U) - 1;
  return std::to_string(uuid & kNumbers);
}

std::string annotationText(pbf_reader reader) {
  std::string name;
  std::string value;
  while (reader.next()) {
    if (reader.tag() == 10) {
      name = reader.get_string();
    } else if (reader.tag() == 4) {
      value = std::to_string(reader.get_int64());
    } else if (reader.tag() == 5) {
      value = shortNumber(reader.get_double());
    } else {
      value = reader.get_string();
    }
  }
  return name + "=" + value;
}

std::string processName(pbf_reader reader) {
  return reader.next(6) ? reader.get_string() : std::string();
}

std::string descriptorText(pbf_reader reader) {
  std::string track;
  std::string parent;
  std::string name;
  std::string kind = "track ";
  while (reader.next()) {
    switch (reader.tag()) {
      case 1:
        track = trackText(reader.get_uint64());
        break;
      case 2:
        name = reader.get_string();
        break;
      case 3:
        return "process " + track + " " + processName(reader.get_message());
      case 5:
        parent = trackText(reader.get_uint64());
        break;
      default:
        kind = "counter ";
        reader.skip();
    }
  }
  return kind + track + " of " + parent + ": " + name;
}

std::string eventText(pbf_reader reader, const std::string& time) {
  static constexpr std::array kTypes{"", "begin", "end", "instant", "count"};
  std::string track;
  std::string type;
  std::string rest;
  std::string notes;
  while (reader.next()) {
    switch (reader.tag()) {
      case 4:
        notes += (notes.empty() ? "" : " ") + annotationText(reader.get_message());
        break;
      case 9:
        type = kTypes.at(reader.get_uint64());
        break;
      case 11:
        track = trackText(reader.get_uint64());
        break;
      case 23:
        rest = " " + reader.get_string();
        break;
      case 44:
        rest = " " + shortNumber(reader.get_double());
        break;
      default:
        reader.skip();
    }
  }
  if (!notes.empty()) rest += " {" + notes + "}";
  return track + " " + type + " " + time + rest;
}

std::string packetText(pbf_reader reader) {
  constexpr double kNanosecondsPerSecond = 1e9;
  std::string time;
  while (reader.next()) {
    switch (reader.tag()) {
      case 8:
        time = shortNumber(static_cast<double>(reader.get_uint64()) / kNanosecondsPerSecond);
        break;
      case 11:
        return eventText(reader.get_message(), time);
      case 60:
        return descriptorText(reader.get_message());
      default:
        reader.skip();
    }
  }
  return "clock";
}

}  // namespace

std::vector<std::string> packetLines(const std::string& trace) {
  std::vector<std::string> lines;
  pbf_reader reader(trace);
  while (reader.next(1)) lines.push_back(packetText(reader.get_message()));
  return lines;
}

}  // namespace halvox::tools
