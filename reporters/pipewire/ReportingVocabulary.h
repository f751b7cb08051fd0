#pragma once

#include "reporters/pipewire/ReportingClient.h"

// The categories, types, service types and keys that this reporter uses. The numbers are those of
// the service's wire interface. They are repeated here because a client does not include the
// service's headers.
namespace halvox::pipewire_reporter {

inline constexpr ServiceType kServiceGeneric = 0;
inline constexpr ServiceType kServiceTelephony = 2;
inline constexpr ServiceType kServiceAlarms = 4;
inline constexpr ServiceType kServiceLongFormAudio = 7;
inline constexpr ServiceType kServiceNonLongFormAudio = 8;
inline constexpr ServiceType kServiceAlerts = 10;

inline constexpr Category kSessionDomain = 0x08000000;
inline constexpr Category kCategorySessionRecord = kSessionDomain | 2U;
inline constexpr Category kCategorySessionPlayback = kSessionDomain | 4U;
inline constexpr Category kCategorySessionSetup = kSessionDomain | 8U;
inline constexpr Category kCategoryRouteChange = 10;
inline constexpr Category kCategoryVolume = 14;

inline constexpr EventType kTypeStart = 1;
inline constexpr EventType kTypeStop = 2;
inline constexpr EventType kTypeSetup = 5;
inline constexpr EventType kTypeIssueDetector = 7;
inline constexpr EventType kTypeState = 18;

inline constexpr const char* kApplicationKey = "HostApplicationDisplayID";
inline constexpr const char* kFormatKey = "session_selected_format";
inline constexpr const char* kDevicesKey = "active_devices";
inline constexpr const char* kVolumeKey = "RQSessionVolume";
inline constexpr const char* kPlayingKey = "RQSessionVolumePlayingState";
inline constexpr const char* kVolumeProcessKey = "RQSessionVolumeOperationProcess";
// The stream's object.serial. Every message has it, to distinguish the streams of one application.
inline constexpr const char* kSerialKey = "object_serial";
// The number of the stream's run, from 1. Without it the service would suppress a second Start as a
// repeat of the first.
inline constexpr const char* kRunKey = "run";
// The stable node names of the devices; kDevicesKey has their descriptions, for people.
inline constexpr const char* kDeviceNamesKey = "device_node_names";

// Keys of an issue: its type, the affected node and application, and how long nothing was heard.
inline constexpr const char* kIssueTypeKey = "issue_type";
inline constexpr const char* kIssueXrun = "xrun";
inline constexpr const char* kNodeKey = "node";
inline constexpr const char* kIssueClientKey = "rtaid_client";
inline constexpr const char* kSilenceKey = "any_channel_silence_seconds";
// How long nothing was heard in milliseconds, the number of missed cycles, the length of a cycle in
// frames at that time, and the rate in Hz.
inline constexpr const char* kXrunMillisecondsKey = "xrun_milliseconds";
inline constexpr const char* kMissedCyclesKey = "missed_cycles";
inline constexpr const char* kQuantumKey = "quantum";
inline constexpr const char* kRateKey = "rate";
// The device that missed the cycles, the node that was late, and the role of the stream in it.
inline constexpr const char* kXrunDeviceKey = "device_node_name";
inline constexpr const char* kLateNodeKey = "late_node";
inline constexpr const char* kLateSerialKey = "late_object_serial";
inline constexpr const char* kLateProcessKey = "late_process";
inline constexpr const char* kXrunRoleKey = "xrun_role";
// The number of the session's report of missed cycles, from 1. Without it the service would
// suppress a report that is equal to the one before, and its cycles would be lost.
inline constexpr const char* kXrunReportKey = "xrun_report";

}  // namespace halvox::pipewire_reporter
