#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>

#include "analysis/RecordSource.h"
#include "analysis/ReportData.h"
#include "analysis/StreamBuilder.h"
#include "analysis/StreamList.h"
#include "analysis/StreamRates.h"
#include "analysis/XrunList.h"

namespace halvox::analysis {

// Makes what a report says from the records of a period, in one pass.
//
//   add() each record, from the oldest; finish() once
//
// Memory: bounded by `bounds` and by that of StreamBuilder. Whatever is beyond a bound is in the
// totals, and counted in ReportData::losses. Belongs to one thread.
class ReportBuilder {
 public:
  explicit ReportBuilder(const ReportBounds& bounds = {});
  ReportBuilder(const ReportBuilder&) = delete;
  ReportBuilder& operator=(const ReportBuilder&) = delete;

  void add(const Record& record);
  // Returns the report. The builder is used up.
  [[nodiscard]] ReportData finish(const StreamBuilder::Finish& finish);

 private:
  void addEvent(const Record& record);
  void addMessage(const Record& record);
  void addXrun(const Record& record);
  void addDriverReport(const Record& record);
  void addSettings(const Record& record);
  void addMetric(const Record& record);
  void addPower(const Record& record);
  void addLoss(const Record& record);
  void addMark(ReportMark mark);
  void onMoment(const StreamStory& story, const StreamMoment& moment);
  void onXrunOfStream(const StreamStory& story, const StreamMoment& moment);
  void addToApplication(const std::string& application, const std::string& device,
                        const ReportXrun& xrun);
  void addXrunsOutsideStreams();
  void noteLosses();
  void noteLoss(std::string_view what, std::string_view reason, std::uint64_t count);
  // Returns a text that fits into the bounds, and counts it if it did not.
  [[nodiscard]] std::string shortened(std::string_view text, std::size_t most);
  [[nodiscard]] std::string name(std::string_view text) { return shortened(text, bounds_.text); }

  const ReportBounds bounds_;
  ReportData data_;
  XrunList xruns_;
  StreamList streams_;
  StreamRates rates_;
  StreamBuilder builder_;
  std::string lastSettings_;
  // Sums of tables, by what names a row.
  std::map<std::pair<std::string, std::string>, ReportApplicationDevice> byApplication_;
  std::map<std::pair<std::string, std::string>, ReportDeviceTimes> deviceTimes_;
  std::map<std::pair<std::string, std::string>, ReportDeviceCounter> deviceCounters_;
  std::map<std::tuple<std::int64_t, std::string, std::string, std::string>, ReportIssue> issues_;
  std::map<std::pair<std::int64_t, std::string>, ReportPower> power_;
  std::map<std::pair<std::string, std::string>, ReportServiceLoss> serviceLosses_;
  ReportTotals ofStreams_;  // the xruns that belong to streams
  // What did not fit.
  std::uint64_t textsCut_ = 0;
  std::uint64_t marksNotKept_ = 0;
  std::uint64_t rowsNotKept_ = 0;
  std::uint64_t damagedReports_ = 0;
};

}  // namespace halvox::analysis
