#pragma once

#include <chrono>
#include <cstdint>

// The defaults of settings, each stated once with its unit and its reason. Configuration and the
// options of the adapters take their defaults from here. An adapter made by a test or a tool
// therefore behaves like that of a service without a configuration file. docs/configuration.md
// repeats the values; a test compares the page with the code. Defaults that no adapter needs are in
// Configuration.h.
namespace halvox::platform::linux_::defaults {

// [listener] A local client authenticates within milliseconds. 30 seconds are enough on a machine
// that swaps. The limit frees the descriptors of clients that connect and stay silent.
inline constexpr std::chrono::seconds kHandshakeTimeout{30};
// The time from the first byte of a message to its last. Longer than kHandshakeTimeout, because a
// message may have 32 MiB.
inline constexpr std::chrono::seconds kMessageTimeout{60};
// Permission bits of the socket of a system service, to which the audio programs of all users
// connect.
inline constexpr std::uint32_t kSocketModeOfSystem = 0666;

// [storage] Days. A month covers "it broke after the last update" without growing forever.
inline constexpr std::uint32_t kRetentionDays = 30;
// MiB of database and write-ahead log together. Enough for roughly a million records of 500 bytes,
// and little on the disk of a desktop machine.
inline constexpr std::uint32_t kStorageMegabytes = 512;

// [analytics]
inline constexpr const char* kWantedEvents = "*";  // a pattern for fnmatch(3): all

// [limits], of one client
// MiB of history and waiting messages. Far more than an audio server needs; a client that leaks
// sessions reaches it before the machine runs out of memory.
inline constexpr std::uint64_t kClientHistoryMegabytes = 256;
// Sessions. An audio server has one session for each stream, and typically tens of streams.
inline constexpr std::uint64_t kClientSessions = 100'000;
// Reporter IDs of one message. A message to 10,000 sessions takes some hundredths of a second,
// during which no other request is carried out.
inline constexpr std::uint64_t kMessageReporterIDs = 10'000;

// [link]
// Servers that keep the stream. More than one needs a cluster, which most installations lack.
inline constexpr std::uint64_t kStreamReplicas = 1;

// [diagnostics]
// Captures, of at most 64 MiB each before compression.
inline constexpr std::uint32_t kKeptSnapshots = 20;

}  // namespace halvox::platform::linux_::defaults
