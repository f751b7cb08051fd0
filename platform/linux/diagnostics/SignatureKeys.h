#pragma once

// The keys of a signature in archives and in the store. "TriggerThresholdValues" is present only
// when the request had such values.
namespace halvox::platform::linux_::signature_key {

inline constexpr const char* kDomain = "Domain";
inline constexpr const char* kType = "Type";
inline constexpr const char* kSubType = "SubType";
inline constexpr const char* kSubtypeContext = "SubtypeContext";
inline constexpr const char* kDetectedProcess = "DetectedProcess";
inline constexpr const char* kTriggerThresholdValues = "TriggerThresholdValues";

}  // namespace halvox::platform::linux_::signature_key
