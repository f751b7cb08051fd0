#pragma once

#include "reporters/pipewire/ReportingClient.h"

// The categories, types, service types and keys that this reporter uses.
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
// Tells the streams of one application apart: the stream's object.serial, in every message.
inline constexpr const char* kSerialKey = "object_serial";
// Counts the runs of one stream from 1, so that a second Start is not a repeat of the first.
inline constexpr const char* kRunKey = "run";
// The stable names behind `kDevicesKey`, which is meant for people.
inline constexpr const char* kDeviceNamesKey = "device_node_names";

// An issue: what it is, the node and the application that had it, and what was not heard of it.
inline constexpr const char* kIssueTypeKey = "issue_type";
inline constexpr const char* kIssueXrun = "xrun";
inline constexpr const char* kNodeKey = "node";
inline constexpr const char* kIssueClientKey = "rtaid_client";
inline constexpr const char* kSilenceKey = "any_channel_silence_seconds";

}  // namespace halvox::pipewire_reporter
