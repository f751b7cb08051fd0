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

// The stateless functions that all components share. Any thread may call them; none blocks but
// HVReportingUtilityWait, and none reports an error: what is unknown has a stated substitute.
namespace halvox {

// --- Texts of the vocabulary --------------------------------------------------------------------

// The two parts of a category's text, for callers that join it to more: nothing is allocated. The
// domain's part ends with "_", or is empty. Both live as long as the process.
struct HVReportingCategoryText {
  std::string_view domain;
  std::string_view name;
};
HVReportingCategoryText HVReportingUtilityCategoryTextParts(AudioEventCategory category);

// The text of a category, made anew: "Session_Playback". A high half that is no single domain gives
// "_" alone before the name; a low half that is no category is "Undefined".
std::string HVReportingUtilityCategoryString(AudioEventCategory category);

// The text of a type; "Generic" for every value without one. Lives as long as the process.
std::string_view HVReportingUtilityTypeString(AudioEventType type);
// The same for a type that was widened.
std::string_view HVReportingUtilityTypeString(std::uint32_t type);

// The name of a service; "telephony" for every value without one. Lives as long as the process.
std::string_view HVReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType serviceType);
// The service of that very name; kUnknown for any other text and for none.
AudioServiceType HVReportingUtilityGenerateServiceTypeFromServiceName(
    std::optional<std::string_view> serviceName);

// --- Decisions ----------------------------------------------------------------------------------

// Whether a message that is due goes out at all: always.
bool HVReportingUtilityShouldSendMessage();
// Whether sessions may send through their open link: always.
bool HVReportingUtilityAllowSessionTransactions();
// Whether the link may collect a service's messages: all but those of kAPIUsage.
bool HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(AudioServiceType serviceType);
// Whether the category has anything in its high half; 0xFFFFFFFF does not count.
bool HVReportingUtilityIsABTestModeOn(AudioEventCategory category);
// The category without its domain.
std::uint16_t HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(
    AudioEventCategory category);
std::int64_t HVReportingUtilityExtractSessionIDFromReporterID(ReporterID reporterID);
// How many seconds a volume must be held to be reported.
double HVReportingUtilityVolumeMinimumPlayingTime(AudioServiceType serviceType);

// --- Device and processes -----------------------------------------------------------------------

// Asks once, at the first call, whether this device runs an internal build, and remembers the
// answer; no answer, or one that is no boolean, means that it does not. Any thread may ask.
class HVReportingInternalBuildAnswer {
 public:
  bool isInternalBuild();

 private:
  std::once_flag once_;
  bool internalBuild_ = false;  // written under once_ only
};

// The answer of this process, asked for once.
bool HVReportingUtilityIsInternalBuild();

// Reads what the platform knows of a process into `record`. False, with `record` left alone, when
// there is no such process.
bool HVReportingUtilityProcessInfoForPID(platform::ProcessID pid, platform::ProcessRecord& record);
// The command name of a process, or this process's own name; none when there is no such process.
std::optional<std::string> HVReportingUtilityProcessNameForPID(platform::ProcessID pid);

// --- Messages -----------------------------------------------------------------------------------

// The value under "HostApplicationDisplayID" of a message or configuration, or "Unknown".
platform::Value HVReportingUtilityRetrieveAppName(const platform::Dictionary& dictionary);
// A copy whose "audiotag" is the category's text and the type's, joined without a separator.
platform::Dictionary HVReportingUtilityAddAudioMessageTag(const platform::Dictionary& dictionary,
                                                          AudioEventCategory category,
                                                          AudioEventType type);
// A copy with "_" for each blank in its keys; of keys that become equal the later one's value is
// kept. Costs next to nothing when there is no blank.
platform::Dictionary HVReportingUtilityRemoveWhiteSpaceFromKeys(
    const platform::Dictionary& dictionary);

// --- Numbers ------------------------------------------------------------------------------------

// Rounds to that many decimal places, halves away from zero; negative places round to tens and so
// on.
double HVReportingUtilityRoundWithPlaces(double value, std::int32_t places);
// The bucket nearest to the number, as a decimal text with at most that many fraction digits (with
// one at least, unless none are allowed), rounded half to even. Walks the buckets, which are sorted
// either way, until they get farther away; of two equally near the later wins. None without
// buckets.
std::optional<std::string> HVReportingUtilityBucketNumberToString(
    const platform::Value& number, const platform::Array& buckets,
    const platform::Value& fractionDigits);

// --- Waiting ------------------------------------------------------------------------------------

// What a one-shot event is guarded by. Its lock guards the event's flag too.
struct HVReportingUtilityCondition {
  std::mutex mutex;
  std::condition_variable condition;
};

// Waits until the flag is set; false when that takes longer than the time-out, which begins anew at
// each wake-up. Logs to `logCategory`: `waitingMessage` and "continuing" at info level,
// `timeoutMessage` at error level. Blocks.
bool HVReportingUtilityWait(HVReportingUtilityCondition& condition, double timeoutSeconds,
                            const bool* flag, std::string_view waitingMessage,
                            std::string_view timeoutMessage, platform::LogCategory& logCategory);
// Sets the flag and wakes one waiter.
void HVReportingUtilitySignal(HVReportingUtilityCondition& condition, bool* flag);

}  // namespace halvox
