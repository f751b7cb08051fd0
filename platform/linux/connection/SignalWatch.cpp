#include "platform/linux/connection/SignalWatch.h"

#include <csignal>
#include <utility>

#include <sys/epoll.h>
#include <sys/signalfd.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

sigset_t endSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}

}  // namespace

void SignalWatch::block() {
  const sigset_t signals = endSignals();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

SignalWatch::SignalWatch(std::function<void()> onSignal) : onSignal_(std::move(onSignal)) {
  const sigset_t signals = endSignals();
  fd_.reset(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
}

bool SignalWatch::start(EventLoop& loop) { return fd_ && loop.watch(fd_.get(), EPOLLIN, *this); }

void SignalWatch::onReady(std::uint32_t /*events*/) {
  signalfd_siginfo signal{};
  if (read(fd_.get(), &signal, sizeof signal) == sizeof signal) onSignal_();
}

}  // namespace halvox::platform::linux_
