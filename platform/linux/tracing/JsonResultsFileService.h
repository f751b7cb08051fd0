#pragma once

#include <filesystem>

#include "platform/object_log.h"
#include "platform/results_file.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Writes results files as JSON, below a root:
//
//   {"product": "HVReporting", "version": 4, "unit": "ns", "values": {"IOStart": [1250, 1310]}}
//
// Names are in the order of their first values, and the values of a name in the order in which they
// were added. A number is written with enough digits that reading it gives the same double. NaN and
// the infinities, which JSON does not have, are null.
//
// A file appears under its name, and replaces an older one, when it is complete and on the disk. No
// symbolic link below the root is followed.
//
// Any thread may call. The composition root owns the service. A file that cannot be written is
// logged and counted; an older file of that name stays.
class JsonResultsFileService final : public ResultsFileService {
 public:
  // The log and the statistics must outlive the service, and the service its writers.
  JsonResultsFileService(std::filesystem::path root, LogService& log,
                         StatisticsService& statistics);

  Writer sswriter_open(std::string_view path, std::string_view productName, std::uint32_t version,
                       std::uint32_t flags) override;
  void sswriter_new_value(Sswriter& writer, std::string_view name, ssunit unit,
                          double value) override;
  void sswriter_close(Writer writer) override;

 private:
  const std::filesystem::path root_;
  const ObjectLog log_;
  Counter& begun_;
  Counter& written_;
  Counter& failed_;
  Counter& values_;
};

}  // namespace halvox::platform::linux_
