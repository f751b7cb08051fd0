#pragma once

#include <chrono>
#include <optional>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

// The requests to the service, as parsed from the arguments of halvoxctl or a line of a script.
// Each has the name of its command.
namespace halvox::tools {

using client::Category;
using client::Dictionary;
using client::EventType;
using client::ReporterID;
using client::ServiceType;

struct Create {
  static constexpr const char* kCommand = "create";
  ReporterID id = 0;
};
struct SetType {
  static constexpr const char* kCommand = "set-type";
  ReporterID id = 0;
  ServiceType type = 0;
};
struct GetType {
  static constexpr const char* kCommand = "type";
  ReporterID id = 0;
};
struct Configure {
  static constexpr const char* kCommand = "configure";
  ReporterID id = 0;
  Dictionary configuration;
};
struct Start {
  static constexpr const char* kCommand = "start";
  ReporterID id = 0;
  std::optional<std::chrono::milliseconds> wait;  // for the answer, which comes at the stop; none:
                                                  // do not wait
};
struct Send {
  static constexpr const char* kCommand = "send";
  std::optional<std::vector<ReporterID>> ids;  // none: all active sessions
  Category category = 0;
  EventType type = 0;
  Dictionary message;
};
struct Stop {
  static constexpr const char* kCommand = "stop";
  ReporterID id = 0;
};
struct Destroy {
  static constexpr const char* kCommand = "destroy";
  ReporterID id = 0;
};
struct Valid {
  static constexpr const char* kCommand = "valid";
  ReporterID id = 0;
};
struct List {
  static constexpr const char* kCommand = "list";
};
struct Kill {
  static constexpr const char* kCommand = "kill";
};
// Only in scripts, whose requests share a connection.
struct WaitForStart {
  static constexpr const char* kCommand = "wait";
  ReporterID id = 0;
  std::chrono::milliseconds timeout{};
};
struct Sleep {
  static constexpr const char* kCommand = "sleep";
  std::chrono::milliseconds time{};
};
// What one command line, or one line of a script, asks of the service.
using Request = std::variant<Create, SetType, GetType, Configure, Start, Send, Stop, Destroy, Valid,
                             List, Kill, WaitForStart, Sleep>;

}  // namespace halvox::tools
