#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/ioreport.h"

namespace halvox {

// What the drivers had counted when a session started: the samples of each channel group, keyed by
// the group's description. The driver statistics make and read it; the session only keeps it.
using DriverSnapShot =
    std::map<std::string, std::shared_ptr<const platform::IOReportSamples>, std::less<>>;

}  // namespace halvox
