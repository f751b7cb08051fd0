#pragma once

#include <chrono>
#include <functional>

namespace halvox::platform::linux_ {

// How long a test waits for what must happen. Only a failing test waits that long, even on a busy
// machine with sanitizers.
inline constexpr std::chrono::seconds kTestDeadline{30};

// Returns true when the condition holds, and false when it does not hold within kTestDeadline.
// Between two checks it calls `turn`; without one, it sleeps for a millisecond.
//
// It is for conditions that nothing signals: the state of the kernel, of another process, or of a
// library. A test waits for a future, a condition variable or a descriptor itself if there is one.
// `turn` drives what runs on the test's own thread, such as an event loop, and may block for a
// fraction of a second until something happens there.
[[nodiscard]] bool eventually(const std::function<bool()>& condition,
                              const std::function<void()>& turn = {});

// Returns true when `count` settles and then keeps its value for `time`. It has settled when two
// readings a tenth of a second apart are equal; if it never settles, the result is false.
//
// It is for what must not happen, such as a wake-up of an idle thread. Nothing signals that it does
// not happen. A test may let real time pass only for this purpose and to test a real clock.
[[nodiscard]] bool staysQuiet(const std::function<long()>& count, std::chrono::milliseconds time);

}  // namespace halvox::platform::linux_
