#pragma once

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "backends/HVReportingVocabulary.h"
#include "platform/process.h"
#include "platform/value.h"

// Stateless functions that all components share. Any thread may call them. Only
// HVReportingUtilityWait blocks. None reports an error: for an unknown value each returns a
// substitute, which its comment states. Wait, Signal, IsABTestModeOn,
// ExtractSessionIDFromReporterID and RoundWithPlaces have no caller but their tests. They are
// nevertheless required. Do not remove them.
namespace halvox {

// --- Texts of the vocabulary --------------------------------------------------------------------

// The two parts of a category's text, for callers that append them without an allocation. `domain`
// is empty or ends with "_". Both live as long as the process.
struct HVReportingCategoryText {
  std::string_view domain;
  std::string_view name;
};
HVReportingCategoryText HVReportingUtilityCategoryTextParts(AudioEventCategory category);

// Returns the text of a category, such as "Session_Playback". If the high half is not exactly one
// domain, only "_" precedes the name. If the low half is not a category, the name is "Undefined".
std::string HVReportingUtilityCategoryString(AudioEventCategory category);

// Returns the text of a type; "Generic" for unlisted values. Lives as long as the process.
std::string_view HVReportingUtilityTypeString(AudioEventType type);
// Does the same for a type in 32 bits: values above 65535 are unlisted, not truncated.
std::string_view HVReportingUtilityTypeString(std::uint32_t type);

// Returns the name of a service. Lives as long as the process. Unlisted values are "telephony",
// which is deliberate.
std::string_view HVReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType serviceType);
// Returns the service with exactly that name; kUnknown for any other text and for none.
AudioServiceType HVReportingUtilityGenerateServiceTypeFromServiceName(
    std::optional<std::string_view> serviceName);

// --- Decisions ----------------------------------------------------------------------------------

// Returns whether messages are sent at all. Always true, but callers are required to ask.
bool HVReportingUtilityShouldSendMessage();
// Returns whether sessions may send through an open link. Always true, but callers are required to
// ask.
bool HVReportingUtilityAllowSessionTransactions();
// Returns whether the link may batch the messages of a service: all services but kAPIUsage.
bool HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(AudioServiceType serviceType);
// Returns whether the category has any bit in its high half. False for 0xFFFFFFFF, although all its
// bits are set.
bool HVReportingUtilityIsABTestModeOn(AudioEventCategory category);
// Returns the category without its domain.
std::uint16_t HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(
    AudioEventCategory category);
// Returns the reporter ID unchanged.
std::int64_t HVReportingUtilityExtractSessionIDFromReporterID(ReporterID reporterID);
// Returns the time in seconds that a volume must be held to be reported.
double HVReportingUtilityVolumeMinimumPlayingTime(AudioServiceType serviceType);

// --- Device and processes -----------------------------------------------------------------------

// Queries once, at the first call, whether this device runs an internal build, and keeps the
// answer. No answer, or one that is not a boolean, means no. Any thread may call; concurrent first
// calls query the device once. It is a class so that a test can have an answer of its own.
class HVReportingInternalBuildAnswer {
 public:
  bool isInternalBuild();

 private:
  std::once_flag once_;
  bool internalBuild_ = false;  // written under once_ only
};

// Returns the answer of this process.
bool HVReportingUtilityIsInternalBuild();

// Reads the platform's record of a process into `record`. Returns false, and does not change
// `record`, when there is no such process.
bool HVReportingUtilityProcessInfoForPID(platform::ProcessID pid, platform::ProcessRecord& record);
// Returns the command name of a process, or this process's own name; std::nullopt when there is no
// such process.
std::optional<std::string> HVReportingUtilityProcessNameForPID(platform::ProcessID pid);

// --- Messages -----------------------------------------------------------------------------------

// Returns the value under "HostApplicationDisplayID" of a message or configuration, or "Unknown".
platform::Value HVReportingUtilityRetrieveAppName(const platform::Dictionary& dictionary);
// Returns a copy whose "audiotag" is the text of the category followed by that of the type, without
// a separator. Replaces an "audiotag" that is there.
platform::Dictionary HVReportingUtilityAddAudioMessageTag(const platform::Dictionary& dictionary,
                                                          AudioEventCategory category,
                                                          AudioEventType type);
// Returns a copy whose keys have "_" in place of each blank (U+0020 only). If two keys become
// equal, the later value is kept. Without blanks the result shares the input's entries, and nothing
// is copied.
platform::Dictionary HVReportingUtilityRemoveWhiteSpaceFromKeys(
    const platform::Dictionary& dictionary);

// --- Numbers ------------------------------------------------------------------------------------

// Rounds to `places` decimal places, halves away from zero. Negative places round to tens, hundreds
// and so on.
double HVReportingUtilityRoundWithPlaces(double value, std::int32_t places);
// Returns the bucket nearest to the number as a decimal text; std::nullopt without buckets. The
// text has at most `fractionDigits` fraction digits, rounded half to even, and at least one unless
// `fractionDigits` is 0.
//
// The buckets must be sorted, in either direction, because the search stops at the first bucket
// that is farther away than the one before. Of two equally near buckets the later is chosen.
std::optional<std::string> HVReportingUtilityBucketNumberToString(
    const platform::Value& number, const platform::Array& buckets,
    const platform::Value& fractionDigits);

// --- Waiting ------------------------------------------------------------------------------------

// Guards a one-shot event. The mutex also guards the event's flag.
struct HVReportingUtilityCondition {
  std::mutex mutex;
  std::condition_variable condition;
};

// Blocks until the flag is set. Returns false on a time-out. Each wake-up restarts the time-out,
// even a spurious one; this is required. Logs to `logCategory`: `waitingMessage` and "continuing"
// at info level, `timeoutMessage` at error level.
bool HVReportingUtilityWait(HVReportingUtilityCondition& condition, double timeoutSeconds,
                            const bool* flag, std::string_view waitingMessage,
                            std::string_view timeoutMessage, platform::LogCategory& logCategory);
// Sets the flag and wakes one waiter.
void HVReportingUtilitySignal(HVReportingUtilityCondition& condition, bool* flag);

}  // namespace halvox
