#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

// The bounds that the connection adapter keeps for each client and for each turn of its loop.
namespace halvox::platform::linux_ {

inline constexpr std::size_t kKiB = 1024;
inline constexpr std::size_t kMiB = 1024 * kKiB;

// A client is not read from while it has that many requests that are read but not carried out, or
// while these hold that many bytes, and is read from again when half of them are done.
inline constexpr std::size_t kMaxOpenRequests = 1024;
inline constexpr std::size_t kMaxOpenRequestBytes = 4 * kMiB;
// What a request counts as whose answer is a list that grows with the service's content: a few
// thousand bytes of such requests could ask for gigabytes of answers.
inline constexpr std::size_t kListRequestWeight = 64;

// A client is not read from while that much waits for its socket to take it, either way.
inline constexpr std::size_t kMaxUnreadReplies = 256;
inline constexpr std::size_t kMaxUnreadReplyBytes = 4 * kMiB;

// What a sender on a bus may have waiting with us; the bus itself cannot be told to hold one sender
// back, so what goes beyond is refused.
inline constexpr std::size_t kMaxWaitingBytesOfSender = 4 * kMiB;

// What one read asks the socket for; larger frames get a buffer of their own.
inline constexpr std::size_t kReadBytes = 64 * kKiB;
// What a client may have delivered in one turn before the others have had theirs.
inline constexpr std::size_t kTurnRequests = 64;
inline constexpr std::size_t kTurnBytes = 64 * kKiB;
// The same when more clients than kFewClients want something, or while a consumer is behind.
inline constexpr std::size_t kShortTurnRequests = 16;
inline constexpr std::size_t kFewClients = 4;

inline constexpr int kEventsPerTurn = 64;
inline constexpr int kAcceptsPerTurn = 64;
// How long accepting waits when descriptors ran out and none of ours is given back.
inline constexpr std::chrono::milliseconds kAcceptRetryDelay{1000};

}  // namespace halvox::platform::linux_
