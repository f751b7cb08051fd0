// Plays an audio program in the tests of missed cycles, and reads PipeWire's profiler without the
// code that these tests examine.
//
//   halvox_audio_client play NAME FRAMES [SANDBOX]
//     Plays silence in cycles of FRAMES frames. Prints "running" when it is first called. For each
//     line "stall MS" of standard input it sleeps in its next cycle, once. SANDBOX is the ID of a
//     sandboxed application, which it sets on its client as the desktop portal does.
//
//   halvox_audio_client profile
//     Prints a line of JSON for each cycle that the profiler reports. A cycle that is reported
//     twice has two lines.
//
// Both end with their standard input.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <iostream>
#include <string>
#include <string_view>
#include <thread>

#include <pipewire/extensions/profiler.h>
#include <pipewire/impl.h>
#include <pipewire/pipewire.h>
#include <spa/param/audio/format-utils.h>
#include <spa/param/profiler.h>
#include <spa/pod/builder.h>
#include <spa/pod/iter.h>
#include <spa/pod/parser.h>

namespace {

constexpr std::uint32_t kRate = 48000;
constexpr std::uint32_t kChannels = 2;
constexpr std::uint32_t kFrameBytes = kChannels * sizeof(float);

// Runs the loop until the end of standard input. Another thread passes each line of the input to
// `handle`.
void runUntilInputEnds(pw_main_loop* loop,
                       const std::function<void(const std::string& line)>& handle) {
  pw_loop* events = pw_main_loop_get_loop(loop);
  spa_source* end = pw_loop_add_event(
      events,
      [](void* data, std::uint64_t) { pw_main_loop_quit(static_cast<pw_main_loop*>(data)); }, loop);
  std::thread input([&] {
    for (std::string line; std::getline(std::cin, line);) handle(line);
    pw_loop_signal_event(events, end);
  });
  pw_main_loop_run(loop);
  input.join();
  pw_loop_destroy_source(events, end);
}

struct Player {
  pw_stream* stream = nullptr;
  std::atomic<int> stall{0};  // milliseconds; the thread of the cycles takes it
  bool isRunning = false;
};

void onProcess(void* data) {
  auto* player = static_cast<Player*>(data);
  if (!player->isRunning) {
    player->isRunning = true;
    std::cout << "running" << std::endl;
  }
  std::this_thread::sleep_for(std::chrono::milliseconds(player->stall.exchange(0)));
  pw_buffer* buffer = pw_stream_dequeue_buffer(player->stream);
  if (buffer == nullptr) return;
  spa_data& samples = buffer->buffer->datas[0];
  const std::uint32_t most = samples.maxsize / kFrameBytes;
  const auto wanted = static_cast<std::uint32_t>(buffer->requested);
  const std::uint32_t frames = wanted > 0 && wanted < most ? wanted : most;
  std::memset(samples.data, 0, std::size_t{frames} * kFrameBytes);
  samples.chunk->offset = 0;
  samples.chunk->stride = kFrameBytes;
  samples.chunk->size = frames * kFrameBytes;
  pw_stream_queue_buffer(player->stream, buffer);
}

int play(const std::string& name, const std::string& frames, const char* sandbox) {
  static const pw_stream_events kEvents = [] {
    pw_stream_events events{};
    events.version = PW_VERSION_STREAM_EVENTS;
    events.process = onProcess;
    return events;
  }();
  pw_main_loop* loop = pw_main_loop_new(nullptr);
  Player player;
  pw_properties* properties = pw_properties_new(
      PW_KEY_MEDIA_TYPE, "Audio", PW_KEY_MEDIA_CATEGORY, "Playback", PW_KEY_MEDIA_ROLE, "Music",
      PW_KEY_NODE_NAME, name.c_str(), PW_KEY_NODE_FORCE_QUANTUM, frames.c_str(), nullptr);
  pw_context* context = pw_context_new(pw_main_loop_get_loop(loop), nullptr, 0);
  pw_properties* client = pw_properties_new(PW_KEY_APP_NAME, name.c_str(), nullptr);
  if (sandbox != nullptr) pw_properties_set(client, "pipewire.access.portal.app_id", sandbox);
  pw_core* core = pw_context_connect(context, client, 0);
  if (core == nullptr) {
    std::cerr << "cannot connect to PipeWire\n";
    return EXIT_FAILURE;
  }
  spa_hook hook{};
  player.stream = pw_stream_new(core, name.c_str(), properties);
  pw_stream_add_listener(player.stream, &hook, &kEvents, &player);
  std::uint8_t buffer[1024];
  spa_pod_builder builder{};
  spa_pod_builder_init(&builder, buffer, sizeof buffer);
  spa_audio_info_raw format{};
  format.format = SPA_AUDIO_FORMAT_F32;
  format.rate = kRate;
  format.channels = kChannels;
  const spa_pod* params[] = {spa_format_audio_raw_build(&builder, SPA_PARAM_EnumFormat, &format)};
  constexpr auto kFlags = static_cast<pw_stream_flags>(
      PW_STREAM_FLAG_AUTOCONNECT | PW_STREAM_FLAG_MAP_BUFFERS | PW_STREAM_FLAG_RT_PROCESS);
  if (pw_stream_connect(player.stream, PW_DIRECTION_OUTPUT, PW_ID_ANY, kFlags, params, 1) < 0) {
    std::cerr << "cannot connect the stream\n";
    return EXIT_FAILURE;
  }
  runUntilInputEnds(loop, [&player](const std::string& line) {
    constexpr std::string_view kStall = "stall ";
    if (line.starts_with(kStall)) player.stall = std::stoi(line.substr(kStall.size()));
  });
  pw_stream_destroy(player.stream);
  pw_core_disconnect(core);
  pw_context_destroy(context);
  pw_main_loop_destroy(loop);
  return EXIT_SUCCESS;
}

// A node of a profiled cycle. A status of 1 or 2 means that it was called and did not finish.
struct ProfiledNode {
  int id = -1;
  const char* name = "";
  int status = 0;
};

ProfiledNode readNode(const spa_pod& value) {
  ProfiledNode node;
  std::int64_t time = 0;
  spa_pod_parse_struct(&value, SPA_POD_Int(&node.id), SPA_POD_String(&node.name),
                       SPA_POD_Long(&time), SPA_POD_Long(&time), SPA_POD_Long(&time),
                       SPA_POD_Long(&time), SPA_POD_Int(&node.status));
  return node;
}

void printCycle(spa_pod_object* cycle) {
  std::int64_t time = 0;
  int xruns = 0;
  ProfiledNode driver;
  std::string followers;
  spa_pod_prop* prop = nullptr;
  SPA_POD_OBJECT_FOREACH(cycle, prop) {
    std::int64_t count = 0;
    float load = 0;
    int number = 0;
    const char* text = nullptr;
    if (prop->key == SPA_PROFILER_info) {
      spa_pod_parse_struct(&prop->value, SPA_POD_Long(&count), SPA_POD_Float(&load),
                           SPA_POD_Float(&load), SPA_POD_Float(&load), SPA_POD_Int(&xruns));
    } else if (prop->key == SPA_PROFILER_clock) {
      spa_pod_parse_struct(&prop->value, SPA_POD_Int(&number), SPA_POD_Int(&number),
                           SPA_POD_String(&text), SPA_POD_Long(&time));
    } else if (prop->key == SPA_PROFILER_driverBlock) {
      driver = readNode(prop->value);
    } else if (prop->key == SPA_PROFILER_followerBlock) {
      const ProfiledNode node = readNode(prop->value);
      followers += (followers.empty() ? "[" : ", [") + std::to_string(node.id) + ", " +
                   std::to_string(node.status) + "]";
    }
  }
  std::cout << R"({"time": )" << time << R"(, "xruns": )" << xruns << R"(, "driver": )" << driver.id
            << R"(, "followers": [)" << followers << "]}\n";
}

void onProfile(void* /*data*/, const spa_pod* profile) {
  auto* pod = const_cast<spa_pod*>(profile);
  auto* const body = static_cast<spa_pod*>(SPA_POD_BODY(pod));
  spa_pod* entry = nullptr;
  SPA_POD_FOREACH(body, SPA_POD_BODY_SIZE(pod), entry) {
    printCycle(reinterpret_cast<spa_pod_object*>(entry));
  }
  std::cout.flush();
}

struct Profiler {
  pw_registry* registry = nullptr;
  pw_proxy* proxy = nullptr;
  spa_hook hook{};
};

void onGlobal(void* data, std::uint32_t id, std::uint32_t /*permissions*/, const char* type,
              std::uint32_t /*version*/, const spa_dict* /*properties*/) {
  static const pw_profiler_events kEvents = {.version = PW_VERSION_PROFILER_EVENTS,
                                             .profile = onProfile};
  auto* profiler = static_cast<Profiler*>(data);
  if (std::strcmp(type, PW_TYPE_INTERFACE_Profiler) != 0) return;
  profiler->proxy = static_cast<pw_proxy*>(
      pw_registry_bind(profiler->registry, id, type, PW_VERSION_PROFILER, 0));
  pw_proxy_add_object_listener(profiler->proxy, &profiler->hook, &kEvents, nullptr);
}

int profile() {
  static const pw_registry_events kEvents = {
      .version = PW_VERSION_REGISTRY_EVENTS, .global = onGlobal, .global_remove = nullptr};
  pw_main_loop* loop = pw_main_loop_new(nullptr);
  pw_context* context = pw_context_new(pw_main_loop_get_loop(loop), nullptr, 0);
  if (pw_context_load_module(context, PW_EXTENSION_MODULE_PROFILER, nullptr, nullptr) == nullptr) {
    std::cerr << "cannot load PipeWire's profiler module\n";
    return EXIT_FAILURE;
  }
  pw_core* core = pw_context_connect(context, nullptr, 0);
  if (core == nullptr) {
    std::cerr << "cannot connect to PipeWire\n";
    return EXIT_FAILURE;
  }
  Profiler profiler;
  spa_hook hook{};
  profiler.registry = pw_core_get_registry(core, PW_VERSION_REGISTRY, 0);
  pw_registry_add_listener(profiler.registry, &hook, &kEvents, &profiler);
  runUntilInputEnds(loop, [](const std::string& /*line*/) {});
  spa_hook_remove(&hook);
  if (profiler.proxy != nullptr) pw_proxy_destroy(profiler.proxy);
  pw_proxy_destroy(reinterpret_cast<pw_proxy*>(profiler.registry));
  pw_core_disconnect(core);
  pw_context_destroy(context);
  pw_main_loop_destroy(loop);
  return EXIT_SUCCESS;
}

}  // namespace

int main(int count, char** arguments) {
  const std::string_view command = count > 1 ? arguments[1] : "";
  pw_init(nullptr, nullptr);
  if (command == "play" && (count == 4 || count == 5)) {
    return play(arguments[2], arguments[3], count == 5 ? arguments[4] : nullptr);
  }
  if (command == "profile" && count == 2) return profile();
  std::cerr << "usage: halvox_audio_client play NAME FRAMES [SANDBOX] | profile\n";
  return EXIT_FAILURE;
}
