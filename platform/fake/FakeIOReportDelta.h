#pragma once

#include "platform/fake/FakeIOReportService.h"

namespace halvox::platform {

// Whether two channels of the fake have the same names and the same format: what a set of channels
// knows them by.
[[nodiscard]] bool areNamedAlike(const FakeIOReportService::Channel& one,
                                 const FakeIOReportService::Channel& other);

// What changed from one list to the other, as IOReportCreateSamplesDelta promises it.
[[nodiscard]] FakeIOReportService::ChannelList differences(
    const FakeIOReportService::ChannelList& previous,
    const FakeIOReportService::ChannelList& current);

}  // namespace halvox::platform
