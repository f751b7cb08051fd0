#include "tools/ReportJson.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <map>
#include <string_view>
#include <unordered_map>
#include <utility>

#include <rapidjson/writer.h>

#include "platform/linux/base/Utf8.h"
#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

using analysis::BucketCounts;
using analysis::NameCounts;
using analysis::ReportData;
using analysis::ReportMessage;
using analysis::ReportStream;
using analysis::ReportXrun;
using platform::linux_::replaceInvalidUtf8;

// Appends to a text. In JSON, "<" occurs only in strings: escaped it cannot end the element that
// holds the JSON, or begin a comment in it.
class ScriptStream {
 public:
  using Ch = char;
  explicit ScriptStream(std::string& text) : text_(text) {}
  void Put(char letter) {
    if (letter == '<') {
      text_ += "\\u003c";
    } else {
      text_ += letter;
    }
  }
  void Flush() {}

 private:
  std::string& text_;
};

// Writes members one after the other. The names are ours, the texts a client's.
class Json {
 public:
  explicit Json(std::string& text) : stream_(text), writer_(stream_) {}

  Json& key(std::string_view name) {
    writer_.Key(name.data(), static_cast<rapidjson::SizeType>(name.size()));
    return *this;
  }
  void text(std::string_view text) {
    const std::string valid = replaceInvalidUtf8(text);
    writer_.String(valid.data(), static_cast<rapidjson::SizeType>(valid.size()));
  }
  void whole(std::uint64_t number) { writer_.Uint64(number); }
  void index(std::int64_t number) { writer_.Int64(number); }
  void flag(bool value) { writer_.Bool(value); }
  void null() { writer_.Null(); }
  // With three digits after the point: milliseconds of a time, microseconds of a millisecond. JSON
  // cannot hold numbers that are not finite.
  void number(double number) {
    constexpr double kDigits = 1000;
    const double scaled = std::round(number * kDigits);
    // A large number has no digits after the point, and the scaled one may be infinite.
    const double rounded = std::isfinite(scaled) ? scaled / kDigits : number;
    std::isfinite(rounded) ? void(writer_.Double(rounded)) : null();
  }
  void number(std::optional<double> value) { value ? number(*value) : null(); }

  template <typename Body>
  void object(Body body) {
    writer_.StartObject();
    body();
    writer_.EndObject();
  }
  template <typename Body>
  void array(Body body) {
    writer_.StartArray();
    body();
    writer_.EndArray();
  }
  template <typename Rows, typename Row>
  void objects(std::string_view name, const Rows& rows, Row row) {
    key(name).array([&] {
      for (const auto& each : rows) object([&] { row(each); });
    });
  }

 private:
  ScriptStream stream_;
  rapidjson::Writer<ScriptStream> writer_;
};

std::string metricID(std::int64_t metric) {
  std::array<char, 24> text{};
  std::snprintf(text.data(), text.size(), "0x%llX", static_cast<unsigned long long>(metric));
  return text.data();
}

void writeFrame(Json& json, const ReportData& data, const ReportFrame& frame) {
  json.key("format").whole(1);
  json.key("program").text(frame.program);
  json.key("store").text(frame.store);
  json.key("made").number(frame.made);
  json.key("asked").object([&] {
    json.key("since").number(frame.since);
    json.key("until").number(frame.until);
  });
  if (data.from && data.to) {
    json.key("period").object([&] {
      json.key("from").number(data.from);
      json.key("to").number(data.to);
    });
  } else {
    json.key("period").null();
  }
  json.key("notes").array([&] {
    for (const std::string& note : frame.notes) json.text(note);
  });
}

void writeTotals(Json& json, const analysis::ReportTotals& totals) {
  json.key("totals").object([&] {
    json.key("events").whole(totals.events);
    json.key("messages").whole(totals.messages);
    json.key("links").whole(totals.linkMessages);
    json.key("metrics").whole(totals.metrics);
    json.key("power").whole(totals.powerEvents);
    json.key("snapshots").whole(totals.snapshots);
    json.key("streams").whole(totals.streams);
    json.key("xruns").whole(totals.xruns);
    json.key("missedCycles").whole(totals.missedCycles);
    json.key("xrunMs").number(totals.xrunMilliseconds);
  });
}

void writeChanges(Json& json, std::string_view name,
                  const std::vector<analysis::StreamChange>& changes) {
  json.key(name).array([&] {
    for (const auto& change : changes) {
      json.array([&] {
        json.number(change.time);
        json.text(change.text);
      });
    }
  });
}

void writeVolumes(Json& json, const ReportStream& stream) {
  json.key("volumes").array([&] {
    for (const auto& step : stream.volumeSteps) {
      json.array([&] {
        json.number(step.time);
        json.number(step.volume);
        json.whole(step.isPlaying ? 1 : 0);
      });
    }
  });
  json.key("volumeTimes").array([&] {
    for (const analysis::VolumeTime& time : stream.story.volumes) {
      json.array([&] {
        json.number(time.volume);
        json.number(time.seconds);
      });
    }
  });
  json.key("otherVolumes").number(stream.story.otherVolumeSeconds);
}

void writeStream(Json& json, const ReportStream& stream) {
  const analysis::StreamStory& story = stream.story;
  json.key("id").index(story.id);
  json.key("app").text(story.application);
  json.key("service").text(story.service);
  json.key("direction").text(analysis::directionName(story.direction));
  json.key("from").number(story.started);
  json.key("to").number(story.ended);
  json.key("end").text(analysis::endName(story.end));
  json.key("open").flag(story.end == analysis::StreamEnd::kStillRunning);
  json.key("ran").number(story.ranSeconds);
  writeVolumes(json, stream);
  writeChanges(json, "routes", story.routes);
  writeChanges(json, "formats", story.formats);
  json.key("xruns").whole(story.xruns.reports);
  json.key("xrunMs").number(story.xruns.milliseconds);
}

// The messages around all xruns, each once. Those of one xrun stand together, because they are in
// the order of storing.
class MessageTable {
 public:
  explicit MessageTable(const std::vector<ReportXrun>& xruns) {
    for (const ReportXrun& xrun : xruns) {
      for (const auto& message : xrun.around) messages_.emplace(message->id, message.get());
    }
    for (const auto& [id, message] : messages_) indices_.emplace(id, indices_.size());
  }

  [[nodiscard]] std::int64_t indexOf(std::int64_t id) const {
    const auto found = indices_.find(id);
    return found == indices_.end() ? -1 : static_cast<std::int64_t>(found->second);
  }
  [[nodiscard]] const std::map<std::int64_t, const ReportMessage*>& messages() const {
    return messages_;
  }

 private:
  std::map<std::int64_t, const ReportMessage*> messages_;  // by id; the report owns them
  std::unordered_map<std::int64_t, std::size_t> indices_;
};

void writeXruns(Json& json, const ReportData& data) {
  std::unordered_map<std::int64_t, std::int64_t> streams;
  for (const ReportStream& stream : data.streams) {
    streams.emplace(stream.story.id, static_cast<std::int64_t>(streams.size()));
  }
  const MessageTable table(data.xruns);
  json.objects("xruns", data.xruns, [&](const ReportXrun& xrun) {
    const auto stream = xrun.storyID ? streams.find(*xrun.storyID) : streams.end();
    json.key("t").number(xrun.time);
    json.key("s").index(stream == streams.end() ? -1 : stream->second);
    json.key("app").text(xrun.application);
    json.key("device").text(xrun.device);
    json.key("ms").number(xrun.milliseconds);
    json.key("cycles").whole(xrun.missedCycles);
    json.key("quantum").index(xrun.quantum);
    json.key("rate").index(xrun.rate);
    json.key("role").text(xrun.role);
    json.key("late").text(xrun.late);
    if (xrun.around.empty()) return;
    json.key("message").index(table.indexOf(xrun.messageID));
    json.key("around").array([&] {
      json.index(table.indexOf(xrun.around.front()->id));
      json.index(table.indexOf(xrun.around.back()->id) + 1);
    });
  });
  json.objects("messages", table.messages(), [&](const auto& entry) {
    const ReportMessage& message = *entry.second;
    json.key("t").number(message.time);
    json.key("app").text(message.application);
    json.key("name").text(message.name);
    json.key("text").text(fieldsOfJson(message.payload));
  });
}

void writeApplications(Json& json, const ReportData& data) {
  json.objects("byApplication", data.byApplication, [&](const auto& row) {
    json.key("app").text(row.application);
    json.key("device").text(row.device);
    json.key("xruns").whole(row.xruns);
    json.key("cycles").whole(row.missedCycles);
    json.key("ms").number(row.milliseconds);
    json.key("longest").number(row.longest);
  });
}

void writeBuckets(Json& json, const BucketCounts& counts) {
  json.key("buckets").array([&] {
    for (const auto& bucket : counts.buckets()) {
      json.array([&] {
        json.number(bucket.lower);
        json.number(bucket.upper);
        json.whole(bucket.hits);
      });
    }
  });
}

void writeDevices(Json& json, const ReportData& data) {
  json.objects("devices", data.deviceTimes, [&](const analysis::ReportDeviceTimes& row) {
    json.key("device").text(row.device);
    json.key("measure").text(row.channel);
    json.key("unit").text(row.unit);
    json.key("count").whole(row.counts.count());
    json.key("p50").number(row.counts.percentile(0.5));
    json.key("p95").number(row.counts.percentile(0.95));
    json.key("p99").number(row.counts.percentile(0.99));
    json.key("max").number(row.counts.percentile(1));
    writeBuckets(json, row.counts);
  });
  json.objects("deviceCounters", data.deviceCounters, [&](const auto& row) {
    json.key("device").text(row.device);
    json.key("counter").text(row.channel);
    json.key("sum").number(row.sum);
    json.key("reports").whole(row.reports);
  });
}

void writeNames(Json& json, const NameCounts& names) {
  constexpr std::string_view kCommonNames = "com.tarno.halvox.";
  json.key("names").object([&] {
    json.key("from").number(names.from());
    json.key("step").number(names.step());
    json.objects("series", names.series(), [&](const NameCounts::Series* series) {
      json.key("name").text(series->name);
      json.key("count").whole(series->count);
      json.key("first").number(series->first);
      json.key("last").number(series->last);
      // Each message has a second event under its service's name. Drawn together they would count
      // twice.
      const bool isDrawn = series->name.starts_with(kCommonNames);
      json.key("drawn").flag(isDrawn);
      json.key("bins").array([&] {
        for (std::size_t step = 0; isDrawn && step < series->steps.size(); ++step) {
          if (series->steps[step] == 0) continue;
          json.array([&] {
            json.whole(step);
            json.whole(series->steps[step]);
          });
        }
      });
    });
  });
}

void writeIssuesAndPower(Json& json, const ReportData& data) {
  json.objects("issues", data.issues, [&](const analysis::ReportIssue& row) {
    json.key("metric").text(metricID(row.metric));
    json.key("type").text(row.type);
    json.key("node").text(row.node);
    json.key("client").text(row.client);
    json.key("count").whole(row.count);
    json.key("first").number(row.first);
    json.key("last").number(row.last);
  });
  json.objects("power", data.power, [&](const analysis::ReportPower& row) {
    json.key("category").index(row.category);
    json.key("name").text(row.name);
    json.key("count").whole(row.count);
    json.key("first").number(row.first);
    json.key("last").number(row.last);
  });
}

void writeTrace(Json& json, const std::optional<ReportTrace>& trace) {
  if (!trace) return json.key("traces").null();
  json.key("traces").object([&] {
    json.key("file").text(trace->file);
    json.key("when").number(trace->when);
    json.objects("intervals", trace->intervals, [&](const ReportTraceInterval& row) {
      json.key("name").text(row.name);
      json.key("count").whole(row.count);
      json.key("p50").number(row.median);
      json.key("p95").number(row.percentile95);
      json.key("p99").number(row.percentile99);
      json.key("max").number(row.maximum);
      writeBuckets(json, row.counts);
    });
  });
}

void writeMarksAndLosses(Json& json, const ReportData& data) {
  json.objects("marks", data.marks, [&](const analysis::ReportMark& mark) {
    json.key("t").number(mark.time);
    json.key("kind").text(mark.kind == analysis::ReportMark::Kind::kCapture ? "capture"
                                                                            : "settings");
    json.key("text").text(mark.text);
  });
  json.objects("serviceLosses", data.serviceLosses, [&](const analysis::ReportServiceLoss& loss) {
    json.key("piece").text(loss.piece);
    json.key("reason").text(loss.reason);
    json.key("count").whole(loss.count);
    json.key("last").number(loss.last);
  });
  json.objects("losses", data.losses, [&](const analysis::ReportLoss& loss) {
    json.key("what").text(loss.what);
    json.key("reason").text(loss.reason);
    json.key("count").whole(loss.count);
  });
}

}  // namespace

void appendReportJson(const ReportData& data, const ReportFrame& frame, std::string& page) {
  Json json(page);
  json.object([&] {
    writeFrame(json, data, frame);
    writeTotals(json, data.totals);
    json.objects("streams", data.streams,
                 [&](const ReportStream& stream) { writeStream(json, stream); });
    writeXruns(json, data);
    writeApplications(json, data);
    writeDevices(json, data);
    writeNames(json, data.names);
    writeIssuesAndPower(json, data);
    writeTrace(json, frame.trace);
    writeMarksAndLosses(json, data);
  });
}

void appendComparisonJson(const ComparisonFrame& frame,
                          const std::vector<analysis::Change>& changes, std::string& page) {
  constexpr double kSecondsPerHour = 3600;
  Json json(page);
  const auto writeSide = [&](std::string_view name, const ComparisonFrame::Side& side) {
    json.key(name).object([&] {
      json.key("store").text(side.store);
      json.key("from").number(side.data.from);
      json.key("to").number(side.data.to);
      json.key("ran").number(hoursOf(side.data) * kSecondsPerHour);
      writeTotals(json, side.data.totals);
    });
  };
  json.object([&] {
    json.key("format").whole(1);
    json.key("program").text(frame.program);
    json.key("made").number(frame.made);
    writeSide("before", frame.before);
    writeSide("after", frame.after);
    json.objects("changes", changes, [&](const analysis::Change& change) {
      json.key("verdict").text(verdictName(change.verdict));
      json.key("what").text(change.what);
      json.key("of").text(change.of);
      json.key("unit").text(change.unit);
      json.key("before").number(change.before);
      json.key("after").number(change.after);
      json.key("ratio").number(change.ratio);
      json.key("low").number(change.low);
      json.key("high").number(change.high);
    });
  });
}

}  // namespace halvox::tools
