#pragma once

#include <chrono>
#include <optional>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

// The requests to the service, as the arguments of halvoxctl or the line of a script say them.
namespace halvox::tools {

using client::Category;
using client::Dictionary;
using client::EventType;
using client::ReporterID;
using client::ServiceType;

struct Create {
  ReporterID id = 0;
};
struct SetType {
  ReporterID id = 0;
  ServiceType type = 0;
};
struct GetType {
  ReporterID id = 0;
};
struct Configure {
  ReporterID id = 0;
  Dictionary configuration;
};
struct Start {
  ReporterID id = 0;
  std::optional<std::chrono::milliseconds> wait;  // for the answer, which comes at the stop
};
struct Send {
  std::optional<std::vector<ReporterID>> ids;  // none: all active sessions
  Category category = 0;
  EventType type = 0;
  Dictionary message;
};
struct Stop {
  ReporterID id = 0;
};
struct Destroy {
  ReporterID id = 0;
};
struct Valid {
  ReporterID id = 0;
};
struct List {};
struct Kill {};
// In scripts only: what one connection can see that a single command cannot.
struct WaitForStart {
  ReporterID id = 0;
  std::chrono::milliseconds timeout{};
};
struct Sleep {
  std::chrono::milliseconds time{};
};
using Request = std::variant<Create, SetType, GetType, Configure, Start, Send, Stop, Destroy, Valid,
                             List, Kill, WaitForStart, Sleep>;

}  // namespace halvox::tools
