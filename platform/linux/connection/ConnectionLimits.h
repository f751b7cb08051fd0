#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

// The bounds that the connection adapter keeps for each client and for each turn of its loop. They
// are constants, not settings: they bound memory and fairness, and clients do not notice their
// values.
namespace halvox::platform::linux_ {

inline constexpr std::size_t kKiB = 1024;
inline constexpr std::size_t kMiB = 1024 * kKiB;

// Flow control stops reading from a client that has this many open requests, or whose open requests
// have this many bytes. It reads again when half of them have been carried out. If it read again
// just below the bound, a client at the bound would stop and start with every request, and each
// start costs a wake-up.
inline constexpr std::size_t kMaxOpenRequests = 1024;
inline constexpr std::size_t kMaxOpenRequestBytes = 4 * kMiB;
// A request whose answer is a list that grows with the number of sessions counts as this many
// requests. Otherwise a few thousand bytes of requests could ask for gigabytes of answers.
inline constexpr std::size_t kListRequestWeight = 64;

// Flow control also stops reading from a client that does not read its replies, because each
// further request would add a reply to the memory. It reads again when the socket has taken half of
// the replies.
inline constexpr std::size_t kMaxUnreadReplies = 256;
inline constexpr std::size_t kMaxUnreadReplyBytes = 4 * kMiB;

// How many bytes of requests of one sender on a bus may wait. Further requests are refused: the
// service cannot stop reading from one sender, because all senders share the connection.
inline constexpr std::size_t kMaxWaitingBytesOfSender = 4 * kMiB;

// The size of one read. Frames larger than this get a buffer of their own.
inline constexpr std::size_t kReadBytes = 64 * kKiB;
// A client's share of one turn. Requests beyond the share wait until the other clients have had
// theirs.
inline constexpr std::size_t kTurnRequests = 64;
inline constexpr std::size_t kTurnBytes = 64 * kKiB;
// The share while more than kFewClients clients have requests or too many messages wait for the
// store. With many clients a full share for each would make a turn long, and all replies of a turn
// wait for its end.
inline constexpr std::size_t kShortTurnRequests = 16;
inline constexpr std::size_t kFewClients = 4;

inline constexpr int kEventsPerTurn = 64;
inline constexpr int kAcceptsPerTurn = 64;
// How long accepting pauses after descriptors have run out, unless a connection of ours ends
// earlier.
inline constexpr std::chrono::milliseconds kAcceptRetryDelay{1000};

}  // namespace halvox::platform::linux_
