#pragma once

#include "platform/fake/FakeIOReportService.h"

namespace halvox::platform {

// Whether two channels of the fake have the same names and format, which identify a channel in a
// set.
[[nodiscard]] bool areNamedAlike(const FakeIOReportService::Channel& one,
                                 const FakeIOReportService::Channel& other);

// The change from one list to the other, as IOReportCreateSamplesDelta promises it. Shares no code
// with the adapter, so that the contract suite compares two implementations.
[[nodiscard]] FakeIOReportService::ChannelList differences(
    const FakeIOReportService::ChannelList& previous,
    const FakeIOReportService::ChannelList& current);

}  // namespace halvox::platform
