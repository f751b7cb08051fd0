#include "bench/load/EchoServer.h"

#include <array>
#include <cstdint>
#include <cstring>
#include <map>
#include <memory>

#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

namespace halvox::bench {
namespace {

struct BusCloser {
  void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};
using Bus = std::unique_ptr<sd_bus, BusCloser>;

int answer(sd_bus_message* message, void* /*userdata*/, sd_bus_error* /*error*/) {
  std::uint8_t type = 0;
  sd_bus_message_get_type(message, &type);
  if (type != SD_BUS_MESSAGE_METHOD_CALL) return 0;
  return sd_bus_reply_method_return(message, nullptr);
}

Bus makeBus(int fd) {
  sd_bus* bus = nullptr;
  sd_id128_t id{};
  id.bytes[0] = 1;
  sd_bus_new(&bus);
  sd_bus_set_fd(bus, fd, fd);
  sd_bus_set_server(bus, 1, id);
  // The least that sd-bus can do: it does not authenticate the client and takes no descriptors.
  sd_bus_set_anonymous(bus, 1);
  sd_bus_negotiate_fds(bus, 0);
  sd_bus_start(bus);
  sd_bus_add_filter(bus, nullptr, answer, nullptr);
  return Bus(bus);
}

void watch(int poller, int fd, int operation, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.fd = fd;
  epoll_ctl(poller, operation, fd, &event);
}

// Handles what has arrived. Returns false when the connection has ended.
bool serve(int poller, int fd, sd_bus* bus) {
  int result = 0;
  // Continues until nothing is left, because sd-bus may hold complete messages that epoll does not
  // report again.
  while ((result = sd_bus_process(bus, nullptr)) > 0) {
  }
  if (result < 0) return false;
  const int events = sd_bus_get_events(bus);
  watch(poller, fd, EPOLL_CTL_MOD, EPOLLIN | ((events & POLLOUT) != 0 ? EPOLLOUT : 0U));
  return true;
}

}  // namespace

int serveEcho(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, socketPath.c_str(), socketPath.size() + 1);
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listener, SOMAXCONN) != 0) {
    return 1;
  }
  const int poller = epoll_create1(EPOLL_CLOEXEC);
  watch(poller, listener, EPOLL_CTL_ADD, EPOLLIN);
  std::map<int, Bus> connections;
  for (;;) {
    std::array<epoll_event, 64> events;
    const int count = epoll_wait(poller, events.data(), static_cast<int>(events.size()), -1);
    for (int index = 0; index < count; ++index) {
      const int fd = events[static_cast<std::size_t>(index)].data.fd;
      if (fd == listener) {
        const int accepted = ::accept4(listener, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
        if (accepted < 0) continue;
        connections[accepted] = makeBus(accepted);
        watch(poller, accepted, EPOLL_CTL_ADD, EPOLLIN);
        // sd_bus_start() has already read the client's first bytes, which epoll will not report.
        if (!serve(poller, accepted, connections.at(accepted).get())) connections.erase(accepted);
      } else if (!serve(poller, fd, connections.at(fd).get())) {
        connections.erase(fd);
      }
    }
  }
}

}  // namespace halvox::bench
