#include "platform/linux/connection/ListeningSocket.h"

#include <cerrno>
#include <optional>
#include <string>
#include <utility>

#include <sys/epoll.h>
#include <sys/socket.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/connection/ConnectionHost.h"
#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/PeerCredentials.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "ListeningSocket"};

std::optional<PeerCredentials> credentialsOf(int fd) {
  ucred credentials{};
  socklen_t size = sizeof credentials;
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return std::nullopt;
  return PeerCredentials{.pid = credentials.pid, .uid = credentials.uid};
}

}  // namespace

ListeningSocket::ListeningSocket(UniqueFd fd, ConnectionHost& host)
    : fd_(std::move(fd)), host_(host), retry_(*this) {}

bool ListeningSocket::start() { return host_.loop().watch(fd_.get(), EPOLLIN, *this); }

void ListeningSocket::tryAgain() {
  if (!std::exchange(isWaiting_, false)) return;
  retry_.stop();
  static_cast<void>(start());
}

void ListeningSocket::onReady(std::uint32_t /*events*/) {
  for (int count = 0; count < kAcceptsPerTurn; ++count) {
    if (!acceptOne()) return;
  }
}

bool ListeningSocket::acceptOne() {
  UniqueFd fd(accept4(fd_.get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
  if (fd) {
    isShort_ = false;
    // If the kernel has no credentials of a client, nothing is known about it. The client is then
    // disconnected.
    if (const std::optional<PeerCredentials> credentials = credentialsOf(fd.get())) {
      host_.acceptPeer(std::move(fd), *credentials);
    }
    return true;
  }
  const int error = errno;
  const bool noDescriptors =
      error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
  if (noDescriptors) waitForDescriptors(error);
  // EAGAIN means that no connection waits, EINVAL and EBADF that the socket is unusable. Any other
  // error concerns only one connection; the caller then tries the next one.
  return !noDescriptors && error != EAGAIN && error != EINVAL && error != EBADF;
}

void ListeningSocket::waitForDescriptors(int error) {
  // The socket stays readable, and the level-triggered loop would spin.
  host_.loop().forget(fd_.get());
  isWaiting_ = true;
  host_.acceptRetries().start(retry_);
  // Log one line for each shortage, not one every second.
  if (std::exchange(isShort_, true)) return;
  host_.statistics().acceptPauses.add();
  kLog.error("cannot accept connections (", errnoText(error),
             "); new clients wait until a connection ends, retrying every second");
}

}  // namespace halvox::platform::linux_
