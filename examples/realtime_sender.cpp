// A sound effect that reports from its audio thread, as a plug-in would.
//
//   c++ -std=c++17 realtime_sender.cpp $(pkg-config --cflags --libs halvox-client) -pthread
//
// process() neither allocates, locks nor makes a system call: it changes two numbers of a message
// that was made before and copies it into the client's queue. main() plays the host: it calls the
// effect for half a second of silence with one loud block.

#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <thread>
#include <vector>

#include <halvox.h>

namespace {

constexpr std::int64_t kSession = 1;
constexpr int kBlocks = 50;
constexpr int kLoudBlock = 20;
constexpr std::size_t kFrames = 480;
constexpr double kRate = 48000;
constexpr std::uint32_t kDsp = HALVOX_DOMAIN_DSP | HALVOX_CATEGORY_PERFORMANCE;

struct Free {
  void operator()(halvox_client* client) const { halvox_client_free(client); }
  void operator()(halvox_dictionary* dictionary) const { halvox_dictionary_free(dictionary); }
};
using Dictionary = std::unique_ptr<halvox_dictionary, Free>;

class Limiter {
 public:
  // May block: the host calls this before the audio thread starts.
  bool prepare() {
    halvox_options options{};
    options.size = sizeof options;
    options.real_time = 1;  // the client's thread looks for messages; nothing wakes it
    client_.reset(halvox_client_new(&options));
    if (!client_) return false;
    const Dictionary configuration(halvox_dictionary_new());
    halvox_dictionary_set_string(configuration.get(), "HostApplicationDisplayID",
                                 "com.example.limiter");
    halvox_client_create_session(client_.get(), kSession);
    halvox_client_set_service_type(client_.get(), kSession, HALVOX_SERVICE_LONGFORMAUDIO);
    halvox_client_set_configuration(client_.get(), kSession, configuration.get());
    halvox_client_start(client_.get(), kSession);

    // New numbers later overwrite these in place.
    message_.reset(halvox_dictionary_new());
    halvox_dictionary_set_double(message_.get(), "peak", 0);
    halvox_dictionary_set_int64(message_.get(), "frame", 0);
    return true;
  }

  // For the audio thread. Reports each block whose peak it had to limit.
  void process(std::vector<float>& block) {
    float peak = 0;
    for (float& sample : block) {
      peak = std::fmax(peak, std::fabs(sample));
      sample = std::fmin(std::fmax(sample, -1.0F), 1.0F);
    }
    if (peak > 1.0F) {
      halvox_dictionary_set_double(message_.get(), "peak", static_cast<double>(peak));
      halvox_dictionary_set_int64(message_.get(), "frame", frame_);
      // If the queue is full the message is dropped and counted; audio never waits.
      halvox_client_send(client_.get(), kSession, message_.get(), kDsp, HALVOX_EVENT_SIMPLE);
    }
    frame_ += static_cast<std::int64_t>(block.size());
  }

  // May block: the host calls this after the audio thread has ended. Returns true if the service
  // answered every message.
  bool release() {
    halvox_client_stop(client_.get(), kSession);
    const bool isAnswered = halvox_client_flush(client_.get(), 5000) == HALVOX_OK;
    halvox_counters counters{};
    counters.size = sizeof counters;
    halvox_client_counters(client_.get(), &counters);
    client_.reset();
    return isAnswered && counters.dropped == 0 && counters.acknowledged == counters.accepted;
  }

 private:
  std::unique_ptr<halvox_client, Free> client_;
  Dictionary message_;
  std::int64_t frame_ = 0;
};

// Calls the effect once in each period, like a sound card.
void runAudio(Limiter& limiter) {
  const auto period = std::chrono::duration_cast<std::chrono::steady_clock::duration>(
      std::chrono::duration<double>(kFrames / kRate));
  auto next = std::chrono::steady_clock::now();
  std::vector<float> block(kFrames);
  for (int i = 0; i < kBlocks; ++i) {
    block.assign(kFrames, i == kLoudBlock ? 1.5F : 0.0F);
    limiter.process(block);
    next += period;
    std::this_thread::sleep_until(next);
  }
}

}  // namespace

int main() {
  Limiter limiter;
  if (!limiter.prepare()) {
    std::fprintf(stderr, "realtime_sender: no memory, or no thread\n");
    return 1;
  }
  std::thread audio([&limiter] { runAudio(limiter); });
  audio.join();
  if (!limiter.release()) {
    std::fprintf(stderr, "realtime_sender: not every message was answered\n");
    return 1;
  }
  return 0;
}
