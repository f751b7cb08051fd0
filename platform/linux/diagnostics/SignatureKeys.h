#pragma once

// The keys of a signature, as its archive and the store show it. "TriggerThresholdValues" is there
// only when values were given.
namespace halvox::platform::linux_::signature_key {

inline constexpr const char* kDomain = "Domain";
inline constexpr const char* kType = "Type";
inline constexpr const char* kSubType = "SubType";
inline constexpr const char* kSubtypeContext = "SubtypeContext";
inline constexpr const char* kDetectedProcess = "DetectedProcess";
inline constexpr const char* kTriggerThresholdValues = "TriggerThresholdValues";

}  // namespace halvox::platform::linux_::signature_key
