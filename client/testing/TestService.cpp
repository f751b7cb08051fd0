#include "client/testing/TestService.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "client/testing/BusValue.h"

namespace halvox::client {
namespace {

using platform::linux_::MutexLock;
using platform::linux_::UniqueFd;

constexpr ServiceType kUnknownService = 65535;

[[noreturn]] void giveUp(const char* what) {
  std::perror(what);
  std::abort();
}

}  // namespace

TestService::TestService(std::string socketPath)
    : socketPath_(std::move(socketPath)), wakeUp_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  thread_ = std::jthread([this] { run(); });
  come();
}

TestService::~TestService() {
  perform([this] {
    leave();
    ended_ = true;
  });
}

void TestService::setStalled(bool stalled) {
  perform([this, stalled] { stalled_ = stalled; });
}

void TestService::vanish() {
  perform([this] { leave(); });
}

void TestService::end() {
  perform([this] {
    for (const auto& connection : connections_) {
      sd_bus_emit_signal(connection.bus.get(), "/com/tarno/halvox/reporting",
                         "com.tarno.halvox.Connection", "Ended", "u", connection.lastRequest);
      sd_bus_flush(connection.bus.get());
    }
    leave();
  });
}

void TestService::setSilent(bool silent) {
  perform([this, silent] { silent_ = silent; });
}

void TestService::come() {
  perform([this] { listen(); });
}

void TestService::refuse(std::string member, std::string errorName) {
  perform([this, &member, &errorName] {
    refusedMember_ = std::move(member);
    errorName_ = std::move(errorName);
  });
}

std::vector<RecordedCall> TestService::calls() {
  const MutexLock lock(mutex_);
  return calls_;
}

std::size_t TestService::count(std::string_view member) {
  const MutexLock lock(mutex_);
  return countLocked(member);
}

bool TestService::waitForCalls(std::string_view member, std::size_t count) {
  const auto deadline = std::chrono::steady_clock::now() + platform::linux_::kTestDeadline;
  const MutexLock lock(mutex_);
  while (countLocked(member) < count) {
    if (!changed_.waitUntil(mutex_, deadline)) return false;
  }
  return true;
}

std::size_t TestService::countLocked(std::string_view member) const {
  const auto found = counts_.find(member);
  return found != counts_.end() ? found->second : 0;
}

std::string TestService::members() {
  std::string members;
  for (const auto& call : calls()) members += (members.empty() ? "" : " ") + call.member;
  return members;
}

void TestService::perform(Job job) {
  const MutexLock lock(mutex_);
  jobs_.push_back(std::move(job));
  const std::size_t own = ++jobsAsked_;
  const std::uint64_t one = 1;
  static_cast<void>(!write(wakeUp_.get(), &one, sizeof one));
  while (jobsDone_ < own) changed_.wait(mutex_);
}

void TestService::run() {
  while (!ended_) {
    std::vector<pollfd> polled{{wakeUp_.get(), POLLIN, 0}};
    if (!stalled_) {
      polled.push_back({listener_.get(), POLLIN, 0});
      for (const auto& connection : connections_) {
        const int events = std::max(sd_bus_get_events(connection.bus.get()), 0);
        polled.push_back({sd_bus_get_fd(connection.bus.get()), static_cast<short>(events), 0});
      }
    }
    poll(polled.data(), polled.size(), -1);

    std::uint64_t count = 0;
    static_cast<void>(!read(wakeUp_.get(), &count, sizeof count));
    std::list<Job> jobs;
    {
      const MutexLock lock(mutex_);
      jobs.swap(jobs_);
    }
    for (const auto& job : jobs) job();
    {
      const MutexLock lock(mutex_);
      jobsDone_ += jobs.size();
      changed_.notifyAll();
    }
    if (stalled_) continue;
    if (listener_) accept();
    for (auto& connection : connections_) serve(connection);
    std::erase_if(connections_,
                  [](const auto& connection) { return sd_bus_is_open(connection.bus.get()) <= 0; });
    if (std::exchange(leaving_, false)) leave();
  }
}

void TestService::listen() {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath_.copy(address.sun_path, sizeof address.sun_path - 1);
  listener_.reset(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) < 0 ||
      ::listen(listener_.get(), SOMAXCONN) < 0) {
    giveUp("test service");
  }
}

void TestService::leave() {
  connections_.clear();
  listener_.reset();
  unlink(socketPath_.c_str());
}

void TestService::accept() {
  UniqueFd fd(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (!fd) return;
  Connection& connection = connections_.emplace_back();
  connection.service = this;
  sd_id128_t id{};
  sd_id128_randomize(&id);
  sd_bus* bus = nullptr;
  if (sd_bus_new(&bus) < 0) giveUp("sd_bus_new");
  connection.bus.reset(bus);
  const int raw = fd.release();
  if (sd_bus_set_fd(bus, raw, raw) < 0 || sd_bus_set_server(bus, 1, id) < 0 ||
      sd_bus_negotiate_fds(bus, 0) < 0 ||
      sd_bus_add_filter(bus, nullptr, onMessage, &connection) < 0 || sd_bus_start(bus) < 0) {
    giveUp("test service's connection");
  }
}

void TestService::serve(Connection& connection) {
  // If sd_bus_process() fails, close the bus. run() then drops it.
  int result = 0;
  do {
    result = sd_bus_process(connection.bus.get(), nullptr);
  } while (result > 0);
  if (result < 0) sd_bus_close(connection.bus.get());
}

int TestService::onMessage(sd_bus_message* message, void* userData, sd_bus_error* /*error*/) {
  auto& connection = *static_cast<Connection*>(userData);
  if (sd_bus_message_is_method_call(message, nullptr, nullptr) <= 0) return 0;
  const int result = connection.service->answer(connection, message);
  return result < 0 ? result : 1;
}

int TestService::answer(Connection& connection, sd_bus_message* message) {
  RecordedCall call{sd_bus_message_get_member(message), {}};
  while (auto argument = readValue(message)) call.arguments.push_back(std::move(*argument));
  {
    const MutexLock lock(mutex_);
    calls_.push_back(call);
    ++counts_[call.member];
    changed_.notifyAll();
  }
  std::uint64_t serial = 0;
  sd_bus_message_get_cookie(message, &serial);
  connection.lastRequest = static_cast<std::uint32_t>(serial);
  if (silent_) return 0;
  if (call.member == refusedMember_) {
    return sd_bus_reply_method_errorf(message, errorName_.c_str(), "refused by the test");
  }
  if (call.member == "sendMessage") return sd_bus_reply_method_return(message, "");
  if (call.member == "killService") {
    leaving_ = true;
    return 0;
  }
  if (call.member == "reporterIDValid" || call.member.starts_with("get") ||
      call.member == "GetCounters") {
    return answerQuery(message, call);
  }
  return answerSessionRequest(connection, message, call);
}

int TestService::answerSessionRequest(Connection& connection, sd_bus_message* message,
                                      const RecordedCall& call) {
  const ReporterID id = call.arguments.empty() ? 0 : call.arguments.back().toInt64();
  auto& sessions = connection.sessions;
  const bool known = sessions.contains(id);
  if (call.member == "createReportingSession") {
    sessions[id] = {};
  } else if (call.member == "setServiceType" && known) {
    sessions[id].type = static_cast<ServiceType>(call.arguments.front().toUInt64());
  } else if (call.member == "startReportingSessionForID" && known && !sessions[id].running) {
    sessions[id].running = true;
    sessions[id].heldStart.reset(sd_bus_message_ref(message));
    return 0;  // answered at the stop
  } else if (call.member == "stopReportingSessionForID" && known) {
    sessions[id].running = false;
    if (sessions[id].heldStart) {
      sd_bus_reply_method_return(sessions[id].heldStart.get(), "b", 1);
      sessions[id].heldStart.reset();
    }
  } else if (call.member == "destroyReportingSession") {
    sessions.erase(id);
  }
  return sd_bus_reply_method_return(message, "b", 1);
}

int TestService::answerQuery(sd_bus_message* message, const RecordedCall& call) {
  if (call.member == "getAllReporters") {
    std::vector<ReporterID> ids;
    for (const auto& connection : connections_) {
      for (const auto& [id, session] : connection.sessions) ids.push_back(id);
    }
    Message reply;
    sd_bus_message_new_method_return(message, reply.out());
    sd_bus_message_append_array(reply.get(), 'x', ids.data(), ids.size() * sizeof(ReporterID));
    return sd_bus_send(nullptr, reply.get(), nullptr);
  }
  if (call.member == "GetCounters") {
    const auto received = static_cast<std::uint64_t>(count("sendMessage"));
    return sd_bus_reply_method_return(message, "a{sv}", 1, "messages, received", "t", received);
  }
  const ReporterID id = call.arguments.empty() ? 0 : call.arguments.front().toInt64();
  const Session* session = find(id);
  const ServiceType type = session != nullptr ? session->type : kUnknownService;
  if (call.member == "getServiceNameForReporterID") {
    return sd_bus_reply_method_return(message, "q", type);
  }
  return sd_bus_reply_method_return(message, "a{sv}", 2, "reporterID", "x",
                                    session != nullptr ? id : ReporterID{0}, "serviceType", "q",
                                    type);
}

TestService::Session* TestService::find(ReporterID id) {
  for (auto& connection : connections_) {
    const auto found = connection.sessions.find(id);
    if (found != connection.sessions.end()) return &found->second;
  }
  return nullptr;
}

}  // namespace halvox::client
