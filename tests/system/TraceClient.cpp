// Plays an audio framework in the tests of tracing: emits trace points, and prints as JSON the
// times between them that it measured itself.
//
//   halvox_trace_client intervals PAIRS    four threads, each its own spacing
//   halvox_trace_client flood EVENTS RATE  pairs from two threads, RATE events a second in all
//   halvox_trace_client burst EVENTS       prints "ready", waits for a line on standard input, and
//                                          emits pairs from one thread as fast as it can

#include <array>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "client/halvox_trace.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kThreads = 4;
constexpr std::uint32_t kSharedBegin = 0x21040010;
constexpr std::uint32_t kSharedEnd = 0x21040014;
constexpr std::uint32_t kCrossBegin = 0x21040018;
constexpr std::uint32_t kCrossEnd = 0x2104001C;
constexpr std::uint32_t kOwnBegin = 0x21040020;  // of thread n: n * kOwnStep further
constexpr std::uint32_t kOwnEnd = 0x21040024;
constexpr std::uint32_t kOwnStep = 8;
constexpr std::uint32_t kFirst = 0x21040000;  // of what the service records
constexpr std::uint32_t kLast = 0x2104408A;
constexpr std::chrono::microseconds kSpacing{500};

void emit(std::uint32_t code) { halvox_trace(code, 1, 2, 3, UINT64_MAX); }

std::vector<std::int64_t> measure(int thread, int pairs) {
  const std::uint32_t own = static_cast<std::uint32_t>(thread) * kOwnStep;
  std::vector<std::int64_t> measured;
  for (int pair = 0; pair < pairs; ++pair) {
    emit(kFirst - 1);
    emit(kFirst);
    emit(kSharedBegin);
    emit(kOwnBegin + own);
    const auto begin = Clock::now();
    std::this_thread::sleep_for(kSpacing * (thread + 1));
    const auto end = Clock::now();
    emit(kOwnEnd + own);
    emit(kSharedEnd);
    emit(kLast);
    emit(kLast + 1);
    measured.push_back((end - begin) / std::chrono::nanoseconds(1));
  }
  return measured;
}

// Begins in one thread what another one ends.
std::int64_t measureAcross() {
  Clock::time_point begin;
  std::thread([&] {
    emit(kCrossBegin);
    begin = Clock::now();
  }).join();
  std::this_thread::sleep_for(kSpacing);
  const auto end = Clock::now();
  std::thread([] { emit(kCrossEnd); }).join();
  return (end - begin) / std::chrono::nanoseconds(1);
}

void print(const std::vector<std::int64_t>& values) {
  const char* separator = "[";
  for (const std::int64_t value : values) {
    std::cout << separator << value;
    separator = ", ";
  }
  std::cout << "]";
}

void intervals(int pairs) {
  std::array<std::vector<std::int64_t>, kThreads> measured;
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back(
        [&, thread] { measured[static_cast<std::size_t>(thread)] = measure(thread, pairs); });
  }
  for (std::thread& thread : threads) thread.join();
  std::cout << "{\"cross\": " << measureAcross() << ", \"own\": [";
  for (int thread = 0; thread < kThreads; ++thread) {
    if (thread != 0) std::cout << ", ";
    print(measured[static_cast<std::size_t>(thread)]);
  }
  std::cout << "]}" << std::endl;
}

void flood(std::int64_t events, double rate) {
  constexpr std::int64_t kBurst = 200;
  constexpr int kFloodThreads = 2;
  const auto work = [&] {
    const auto start = Clock::now();
    for (std::int64_t event = 0; event < events / kFloodThreads; event += 2) {
      emit(kSharedBegin);
      emit(kSharedEnd);
      if (event % kBurst != 0) continue;
      const std::chrono::duration<double> due(static_cast<double>(event) * kFloodThreads / rate);
      std::this_thread::sleep_until(start + due);
    }
  };
  const auto start = Clock::now();
  std::thread first(work);
  std::thread second(work);
  first.join();
  second.join();
  std::cout << "{\"nanoseconds\": " << (Clock::now() - start) / std::chrono::nanoseconds(1) << "}"
            << std::endl;
}

void burst(std::int64_t events) {
  std::cout << "ready" << std::endl;
  std::string line;
  std::getline(std::cin, line);
  for (std::int64_t event = 0; event < events; event += 2) {
    emit(kSharedBegin);
    emit(kSharedEnd);
  }
}

}  // namespace

int main(int count, char** arguments) {
  const std::vector<std::string> words(arguments + 1, arguments + count);
  if (words.size() == 2 && words[0] == "intervals") {
    intervals(std::stoi(words[1]));
  } else if (words.size() == 3 && words[0] == "flood") {
    flood(std::stoll(words[1]), std::stod(words[2]));
  } else if (words.size() == 2 && words[0] == "burst") {
    burst(std::stoll(words[1]));
  } else {
    std::cerr << "usage: halvox_trace_client intervals PAIRS | flood EVENTS RATE | burst EVENTS\n";
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}
