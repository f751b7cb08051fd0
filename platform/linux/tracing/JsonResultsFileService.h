#pragma once

#include <filesystem>

#include "platform/results_file.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Results files as JSON, below a root:
//
//   {"product": "HVReporting", "version": 4, "unit": "ns", "values": {"IOStart": [1250, 1310]}}
//
// Names stand in the order in which their first values came, the values of one name in the order in
// which they came. Numbers are written so that reading them gives the same double. What is no
// number, which JSON does not have, is null. A file has its name, in the place of one that had it,
// when it is whole and on the disk. No symbolic link below the root is followed.
//
// Any thread may call. A file that cannot be finished is logged and counted; what had its name
// before stays.
class JsonResultsFileService final : public ResultsFileService {
 public:
  // The statistics must outlive the service, the service its writers.
  JsonResultsFileService(std::filesystem::path root, StatisticsService& statistics);

  Writer sswriter_open(std::string_view path, std::string_view productName, std::uint32_t version,
                       std::uint32_t flags) override;
  void sswriter_new_value(Sswriter& writer, std::string_view name, ssunit unit,
                          double value) override;
  void sswriter_close(Writer writer) override;

 private:
  const std::filesystem::path root_;
  Counter& begun_;
  Counter& written_;
  Counter& failed_;
  Counter& values_;
};

}  // namespace halvox::platform::linux_
