#include "platform/linux/pipewire/ProfileDecoder.h"

#include <cmath>
#include <optional>
#include <string_view>
#include <utility>

#include <spa/param/profiler.h>
#include <spa/pod/iter.h>
#include <spa/pod/parser.h>

namespace halvox::pipewire {
namespace {

// The stages of a node's work in a cycle, as the profiler numbers them. A node that has not been
// called is not late itself, but waits for another node that is late.
constexpr std::int32_t kWaiting = 0;
constexpr std::int32_t kCalled = 1;
constexpr std::int32_t kAwake = 2;
constexpr std::int32_t kFinished = 3;

// The longest plausible cycle: no device works in longer ones, and a driver that reports one is not
// an audio clock.
constexpr std::chrono::duration<double> kLongestCycle{10};

bool readClock(const spa_pod& value, ProfiledCycle& cycle) {
  std::int32_t flags = 0;
  std::int32_t id = 0;
  const char* name = nullptr;
  std::int64_t time = 0;
  spa_fraction rate{};
  std::int64_t position = 0;
  std::int64_t duration = 0;
  if (spa_pod_parse_struct(&value,                                                        //
                           SPA_POD_Int(&flags), SPA_POD_Int(&id), SPA_POD_String(&name),  //
                           SPA_POD_Long(&time), SPA_POD_Fraction(&rate),                  //
                           SPA_POD_Long(&position), SPA_POD_Long(&duration)) < 0 ||
      rate.num == 0 || rate.denom == 0) {
    return false;
  }
  cycle.time = std::chrono::nanoseconds(time);
  cycle.length =
      std::chrono::duration<double>(static_cast<double>(duration) * rate.num / rate.denom);
  cycle.quantum = duration;
  // The clock has the length of one frame, such as 1/48000.
  cycle.rate = std::lround(static_cast<double>(rate.denom) / rate.num);
  return cycle.length.count() > 0 && cycle.length <= kLongestCycle;
}

// `name` belongs to the event.
struct ReadNode {
  ProfiledNode node;
  std::string_view name{};
  std::int32_t stage = 0;
};

std::optional<ReadNode> readNode(const spa_pod& value) {
  std::int32_t id = 0;
  const char* name = nullptr;
  std::int64_t previousSignal = 0;
  std::int64_t signal = 0;
  std::int64_t awake = 0;
  std::int64_t finish = 0;
  std::int32_t stage = 0;
  if (spa_pod_parse_struct(&value,                                   //
                           SPA_POD_Int(&id), SPA_POD_String(&name),  //
                           SPA_POD_Long(&previousSignal), SPA_POD_Long(&signal),
                           SPA_POD_Long(&awake), SPA_POD_Long(&finish), SPA_POD_Int(&stage)) < 0) {
    return std::nullopt;
  }
  ReadNode read{.node = {.id = static_cast<std::uint32_t>(id)},
                // A node may have no name.
                .name = name == nullptr ? std::string_view() : name,
                .stage = stage};
  // A stage that was not reached has the time of an earlier cycle, or none, which is 0. Requiring
  // positive times also keeps the differences from overflowing.
  if (signal > 0 && awake >= signal && stage >= kAwake) {
    read.node.wait = std::chrono::nanoseconds(awake - signal);
    if (finish >= awake && stage >= kFinished) {
      read.node.busy = std::chrono::nanoseconds(finish - awake);
    }
  }
  return read;
}

void addFollower(const ReadNode& read, ProfiledCycle& cycle) {
  if (read.stage == kWaiting) cycle.waiting.push_back(read.node.id);
  if (read.stage < kCalled || read.stage > kFinished) return;
  cycle.followers.push_back(read.node);
  if (read.stage < kFinished) {
    cycle.late.push_back({.id = read.node.id, .name = std::string(read.name)});
  }
}

void setDriver(const ReadNode& read, ProfiledCycle& cycle) {
  cycle.driver = read.node;
  cycle.driverName = read.name;
}

// Reads the count of xruns, which is the last of the load figures. The others are not used.
std::uint32_t readXruns(const spa_pod& value) {
  std::int64_t counter = 0;
  float fast = 0;
  float medium = 0;
  float slow = 0;
  std::int32_t xruns = 0;
  const bool isRead =
      spa_pod_parse_struct(&value, SPA_POD_Long(&counter), SPA_POD_Float(&fast),
                           SPA_POD_Float(&medium), SPA_POD_Float(&slow), SPA_POD_Int(&xruns)) >= 0;
  return isRead ? static_cast<std::uint32_t>(xruns) : 0;
}

std::optional<ProfiledCycle> readCycle(const spa_pod* pod) {
  // The macros of the library take no pointer to const. They do not change the object.
  auto* object = reinterpret_cast<spa_pod_object*>(const_cast<spa_pod*>(pod));
  ProfiledCycle cycle;
  bool hasClock = false;
  spa_pod_prop* prop = nullptr;
  SPA_POD_OBJECT_FOREACH(object, prop) {
    if (prop->key == SPA_PROFILER_info) {
      cycle.driverXruns = readXruns(prop->value);
    } else if (prop->key == SPA_PROFILER_clock) {
      hasClock = readClock(prop->value, cycle);
    } else if (prop->key == SPA_PROFILER_driverBlock) {
      if (const auto read = readNode(prop->value)) setDriver(*read, cycle);
    } else if (prop->key == SPA_PROFILER_followerBlock) {
      if (const auto read = readNode(prop->value)) addFollower(*read, cycle);
    }
  }
  return hasClock ? std::optional(std::move(cycle)) : std::nullopt;
}

}  // namespace

std::vector<ProfiledCycle> decodeProfile(const spa_pod* profile) {
  std::vector<ProfiledCycle> cycles;
  if (profile == nullptr || !spa_pod_is_struct(profile)) return cycles;
  auto* pod = const_cast<spa_pod*>(profile);
  spa_pod* entry = nullptr;
  auto* const body = static_cast<spa_pod*>(SPA_POD_BODY(pod));
  SPA_POD_FOREACH(body, SPA_POD_BODY_SIZE(pod), entry) {
    if (!spa_pod_is_object_type(entry, SPA_TYPE_OBJECT_Profiler)) continue;
    if (auto cycle = readCycle(entry)) cycles.push_back(*std::move(cycle));
  }
  return cycles;
}

}  // namespace halvox::pipewire
