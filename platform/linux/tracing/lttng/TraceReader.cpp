#include "platform/linux/tracing/lttng/TraceReader.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>
#include <vector>

#include <babeltrace2/babeltrace.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

template <typename Object, auto kPut>
using Reference = UniqueHandle<const Object*, kPut>;
using Plugin = Reference<bt_plugin, bt_plugin_put_ref>;
using Graph = UniqueHandle<bt_graph*, bt_graph_put_ref>;
using Text = UniqueHandle<bt_value*, bt_value_put_ref>;

constexpr std::string_view kEventName = "halvox:kdebug";
constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;

// The value of an integer field, signed or unsigned; 0 for any other field.
std::uint64_t number(const bt_field* field) {
  if (field == nullptr) return 0;
  const bt_field_class_type type = bt_field_get_class_type(field);
  if (bt_field_class_type_is(type, BT_FIELD_CLASS_TYPE_UNSIGNED_INTEGER)) {
    return bt_field_integer_unsigned_get_value(field);
  }
  if (!bt_field_class_type_is(type, BT_FIELD_CLASS_TYPE_SIGNED_INTEGER)) return 0;
  return static_cast<std::uint64_t>(bt_field_integer_signed_get_value(field));
}

const bt_field* member(const bt_field* structure, const char* name) {
  if (structure == nullptr) return nullptr;
  return bt_field_structure_borrow_member_field_by_name_const(structure, name);
}

void copyText(const bt_field* field, std::array<char, 16>& text) {
  if (field == nullptr || bt_field_get_class_type(field) != BT_FIELD_CLASS_TYPE_STRING) return;
  const char* const value = bt_field_string_get_value(field);
  std::copy_n(value, ::strnlen(value, text.size() - 1), text.begin());
}

// The end of the graph: passes each message to the listener. Lives on the stack of readTraces();
// the library calls it on that thread.
class Sink {
 public:
  Sink(const TraceListener& listener, TraceReading& reading)
      : listener_(listener), reading_(reading) {}

  void take(const bt_message* message) {
    switch (bt_message_get_type(message)) {
      case BT_MESSAGE_TYPE_EVENT:
        return takeEvent(message);
      case BT_MESSAGE_TYPE_DISCARDED_EVENTS:
        return count(bt_message_discarded_events_get_count, message, reading_.lost);
      case BT_MESSAGE_TYPE_DISCARDED_PACKETS:
        return count(bt_message_discarded_packets_get_count, message, reading_.lostPackets);
      default:  // messages about the begin and end of streams and packets
        return;
    }
  }

  static bt_graph_simple_sink_component_initialize_func_status initialize(
      bt_message_iterator* /*iterator*/, void* /*sink*/) {
    return BT_GRAPH_SIMPLE_SINK_COMPONENT_INITIALIZE_FUNC_STATUS_OK;
  }

  // noexcept, because the library is C and an exception must not cross it. Only a lack of memory
  // could cause one.
  static bt_graph_simple_sink_component_consume_func_status consume(bt_message_iterator* iterator,
                                                                    void* sink) noexcept {
    using Status = bt_graph_simple_sink_component_consume_func_status;
    bt_message_array_const messages = nullptr;
    std::uint64_t count = 0;
    const auto status = bt_message_iterator_next(iterator, &messages, &count);
    // The cast is valid, because babeltrace defines the statuses of an iterator and of a sink with
    // the same numbers.
    if (status != BT_MESSAGE_ITERATOR_NEXT_STATUS_OK) return static_cast<Status>(status);
    auto& self = *static_cast<Sink*>(sink);
    for (std::uint64_t index = 0; index < count; ++index) {
      // Release the remaining messages of the array unread, because each of them is a reference
      // that must be released.
      if (self.wantsMore_) self.take(messages[index]);
      bt_message_put_ref(messages[index]);
    }
    return self.wantsMore_ ? BT_GRAPH_SIMPLE_SINK_COMPONENT_CONSUME_FUNC_STATUS_OK
                           : BT_GRAPH_SIMPLE_SINK_COMPONENT_CONSUME_FUNC_STATUS_END;
  }

 private:
  template <typename Get>
  static void count(Get get, const bt_message* message, std::uint64_t& total) {
    std::uint64_t lost = 0;
    const bool isKnown = get(message, &lost) == BT_PROPERTY_AVAILABILITY_AVAILABLE;
    // An unknown number counts as one, so that a loss is never reported as 0.
    total += isKnown ? lost : 1;
  }

  void takeEvent(const bt_message* message) {
    const bt_event* const event = bt_message_event_borrow_event_const(message);
    const char* const name = bt_event_class_get_name(bt_event_borrow_class_const(event));
    // A channel may hold events of other providers.
    if (name == nullptr || kEventName != name) return;
    const bt_clock_snapshot* const clock =
        bt_message_event_borrow_default_clock_snapshot_const(message);
    // All streams of a recording have the clock of one machine.
    if (!hasClock_) takeClock(bt_clock_snapshot_borrow_clock_class_const(clock));
    trace_point point = read(event);
    point.timestamp = bt_clock_snapshot_get_value(clock);
    std::int64_t sinceOrigin = 0;
    if (bt_clock_snapshot_get_ns_from_origin(clock, &sinceOrigin) ==
        BT_CLOCK_SNAPSHOT_GET_NS_FROM_ORIGIN_STATUS_OK) {
      point.walltime = static_cast<double>(sinceOrigin) / double{kNanosecondsPerSecond};
    }
    ++reading_.events;
    wantsMore_ = listener_.onEvent(point);
  }

  void takeClock(const bt_clock_class* clock) {
    hasClock_ = true;
    TraceClock result;
    result.ticksPerSecond = bt_clock_class_get_frequency(clock);
    bt_clock_class_get_offset(clock, &result.offsetSeconds, &result.offsetTicks);
    listener_.onClock(result);
  }

  static trace_point read(const bt_event* event) {
    const bt_field* const payload = bt_event_borrow_payload_field_const(event);
    const bt_field* const context = bt_event_borrow_common_context_field_const(event);
    const bt_packet* const packet = bt_event_borrow_packet_const(event);
    trace_point point;
    point.debugid = static_cast<std::uint32_t>(number(member(payload, "code")));
    point.arg1 = number(member(payload, "arg1"));
    point.arg2 = number(member(payload, "arg2"));
    point.arg3 = number(member(payload, "arg3"));
    point.arg4 = number(member(payload, "arg4"));
    point.threadid = number(member(context, "vtid"));
    point.pid = static_cast<std::int32_t>(number(member(context, "vpid")));
    copyText(member(context, "procname"), point.command);
    const bt_field* const ofPacket = bt_packet_borrow_context_field_const(packet);
    point.cpu = static_cast<std::uint32_t>(number(member(ofPacket, "cpu_id")));
    return point;
  }

  const TraceListener& listener_;
  TraceReading& reading_;
  bool hasClock_ = false;
  bool wantsMore_ = true;
};

// The cause of the library's latest error. The call clears it.
std::string latestError() {
  const bt_error* const error = bt_current_thread_take_error();
  if (error == nullptr) return "unknown error";
  std::string text;
  if (bt_error_get_cause_count(error) > 0) {
    text = bt_error_cause_get_message(bt_error_borrow_cause_by_index(error, 0));
  }
  bt_error_release(error);
  return text;
}

// Returns the directories that hold a trace. Each of them has a file "metadata".
std::vector<std::string> traceDirectories(const std::filesystem::path& root) {
  // LTTng writes a trace of its own for each user and word size, in directories below the root.
  std::vector<std::string> directories;
  std::error_code error;
  std::filesystem::recursive_directory_iterator entry(root, error);
  for (; !error && entry != std::filesystem::recursive_directory_iterator();
       entry.increment(error)) {
    if (entry->path().filename() == "metadata") {
      directories.push_back(entry->path().parent_path().string());
    }
  }
  return directories;
}

// Connects one source for each directory through a muxer, which orders the events by time, to a
// sink. Used once, by one thread.
class TraceGraph {
 public:
  // True if the graph can run. Otherwise latestError() returns the reason.
  [[nodiscard]] bool build(const std::vector<std::string>& directories, Sink& sink) {
    // The plugins are looked up by name at run time; a machine may lack them.
    graph_.reset(bt_graph_create(0));
    if (!graph_ || !find("ctf", ctf_) || !find("utils", utils_)) return false;
    const auto* const filter =
        bt_plugin_borrow_filter_component_class_by_name_const(utils_.get(), "muxer");
    if (filter == nullptr) return false;
    // Set the log level to none, because by default the library writes to standard error.
    if (bt_graph_add_filter_component(graph_.get(), filter, "muxer", nullptr, BT_LOGGING_LEVEL_NONE,
                                      &muxer_) != BT_GRAPH_ADD_COMPONENT_STATUS_OK) {
      return false;
    }
    return std::ranges::all_of(directories, [this](const auto& path) { return addSource(path); }) &&
           addSink(sink);
  }

  [[nodiscard]] bool run() { return bt_graph_run(graph_.get()) == BT_GRAPH_RUN_STATUS_OK; }

 private:
  static bool find(const char* name, Plugin& plugin) {
    // Do not search the user's directory of plugins, and do not fail because another plugin cannot
    // be loaded.
    return bt_plugin_find(name, BT_TRUE, BT_FALSE, BT_TRUE, BT_TRUE, BT_FALSE, plugin.out()) ==
           BT_PLUGIN_FIND_STATUS_OK;
  }

  bool addSource(const std::string& directory) {
    const auto* const type =
        bt_plugin_borrow_source_component_class_by_name_const(ctf_.get(), "fs");
    const Text parameters(bt_value_map_create());
    bt_value* inputs = nullptr;
    if (type == nullptr || !parameters ||
        bt_value_map_insert_empty_array_entry(parameters.get(), "inputs", &inputs) != 0 ||
        bt_value_array_append_string_element(inputs, directory.c_str()) != 0) {
      return false;
    }
    const bt_component_source* source = nullptr;
    // Names must be unique within a graph.
    const std::string name = "source" + std::to_string(sources_++);
    if (bt_graph_add_source_component(graph_.get(), type, name.c_str(), parameters.get(),
                                      BT_LOGGING_LEVEL_NONE,
                                      &source) != BT_GRAPH_ADD_COMPONENT_STATUS_OK) {
      return false;
    }
    const std::uint64_t ports = bt_component_source_get_output_port_count(source);
    for (std::uint64_t index = 0; index < ports; ++index) {
      if (!connect(bt_component_source_borrow_output_port_by_index_const(source, index))) {
        return false;
      }
    }
    return true;
  }

  // The muxer adds a free port whenever one is connected.
  bool connect(const bt_port_output* port) {
    const std::uint64_t last = bt_component_filter_get_input_port_count(muxer_) - 1;
    const bt_port_input* const free =
        bt_component_filter_borrow_input_port_by_index_const(muxer_, last);
    return bt_graph_connect_ports(graph_.get(), port, free, nullptr) ==
           BT_GRAPH_CONNECT_PORTS_STATUS_OK;
  }

  bool addSink(Sink& sink) {
    const bt_component_sink* component = nullptr;
    if (bt_graph_add_simple_sink_component(graph_.get(), "sink", Sink::initialize, Sink::consume,
                                           nullptr, &sink,
                                           &component) != BT_GRAPH_ADD_COMPONENT_STATUS_OK) {
      return false;
    }
    return bt_graph_connect_ports(graph_.get(),
                                  bt_component_filter_borrow_output_port_by_index_const(muxer_, 0),
                                  bt_component_sink_borrow_input_port_by_index_const(component, 0),
                                  nullptr) == BT_GRAPH_CONNECT_PORTS_STATUS_OK;
  }

  Plugin ctf_;
  Plugin utils_;
  Graph graph_;
  const bt_component_filter* muxer_ = nullptr;  // owned by the graph
  unsigned sources_ = 0;
};

}  // namespace

// Calculates in integers where possible, because a double has 53 bits, and nanoseconds since 1970
// need 61.
std::uint64_t TraceClock::toNanoseconds(std::uint64_t ticks) const {
  const std::uint64_t sum = ticks + offsetTicks;
  const std::uint64_t seconds = sum / ticksPerSecond + static_cast<std::uint64_t>(offsetSeconds);
  const std::uint64_t rest = sum % ticksPerSecond;
  const double exact = static_cast<double>(rest) * double{kNanosecondsPerSecond} /
                       static_cast<double>(ticksPerSecond);
  const std::uint64_t nanoseconds =
      ticksPerSecond == kNanosecondsPerSecond ? rest : static_cast<std::uint64_t>(exact);
  return seconds * kNanosecondsPerSecond + nanoseconds;
}

TraceReading readTraces(const std::filesystem::path& directory, const TraceListener& listener) {
  TraceReading reading;
  const auto directories = traceDirectories(directory);
  // No event was emitted while the trace ran, which is not a failure.
  if (directories.empty()) return reading;
  Sink sink(listener, reading);
  TraceGraph graph;
  if (!graph.build(directories, sink) || !graph.run()) reading.failure = latestError();
  return reading;
}

}  // namespace halvox::platform::linux_
