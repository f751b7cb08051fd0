#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

// What halvoxctl can be asked for, as its arguments say it.
namespace halvox::tools {

using client::Category;
using client::Dictionary;
using client::EventType;
using client::ReporterID;
using client::ServiceType;

// How a run of halvoxctl ends; documented in its manual page.
enum class ExitStatus : int {
  kDone = 0,
  kRefused = 1,       // the service said no
  kBadArguments = 2,  //
  kNoService = 69,    // EX_UNAVAILABLE: nobody answers, the connection was lost, there is no store
  kCannotWrite = 74,  // EX_IOERR: standard output takes nothing, a file cannot be read or changed
  kBadConfiguration = 78,  // EX_CONFIG
};

// Requests to the service.
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

// One request per line, over one connection.
struct RunScript {
  std::string file;  // "-": standard input
  bool keepGoing = false;
};
struct RunShell {};

struct ShowEvents {
  std::vector<std::string> names{};  // glob patterns; none: all
  std::optional<double> since{};     // seconds since 1970
  std::optional<double> until{};
  std::optional<std::uint64_t> last{};
  bool follow = false;
  std::string database{};  // empty: where the service's configuration puts it
};

// Settings that the service follows while it runs.
struct Preferences {
  enum class Action : std::uint8_t { kGet, kSet, kUnset };
  Action action = Action::kGet;
  std::string domain{};
  std::optional<std::string> key{};    // none: all, to get
  std::optional<std::string> value{};  // to set
  bool isString = false;               // whatever the value looks like
  std::string user = "mobile";
  std::string directory{};  // empty: where the service's configuration puts it
};
struct PostNotification {
  std::string name{};
  std::string directory{};  // empty: where the service's configuration puts it
};

// Archives of diagnostics; the file "newest" is the newest of the service's.
struct ShowSnapshot {
  std::string file{};
};
struct ExtractSnapshot {
  std::string file{};
  std::string directory{};  // empty: one named as the archive, in the working directory
  bool force = false;       // replaces files that are there
};

// Stored records of the other kinds.
struct ShowRecords {
  enum class Kind : std::uint8_t { kMetrics, kPower, kLink, kSnapshots };
  Kind kind = Kind::kLink;
  ShowEvents selection{};  // its names are those of power events or of the link's services
  // Numbers that the records have; none: all.
  std::vector<std::int64_t> ids{};  // of metrics, or of the link's sessions
  std::vector<std::int64_t> categories{};
  std::vector<std::int64_t> types{};
};

// The summaries that the service leaves of its sessions on internal builds.
struct ShowSummaries {
  std::vector<std::string> files{};  // none: the newest of the service's
  std::uint64_t last = 10;
};

// Traces by the service, and the results that they leave.
struct RecordTrace {
  std::string params{};                // the trace parameters file
  std::vector<std::string> command{};  // the program and its arguments
};
struct ShowTrace {
  std::string file{};
};
struct ExportTrace {
  std::string file{};
  std::string to{};
};

// The driver channels that there are.
struct ShowDrivers {
  std::string group{};  // empty: all
  std::optional<std::chrono::milliseconds> watch{};
};

// What all commands take.
struct CommonOptions {
  bool json = false;
  std::string socket;  // empty: the client's default
  std::chrono::milliseconds timeout{5000};
};

struct Command {
  std::variant<Request, RunScript, RunShell, ShowEvents, ShowSummaries, ShowRecords, Preferences,
               PostNotification, ShowSnapshot, ExtractSnapshot, ShowDrivers, RecordTrace, ShowTrace,
               ExportTrace>
      what;
  CommonOptions options;
};

}  // namespace halvox::tools
