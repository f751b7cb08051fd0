#include "platform/linux/connection/SignalWatch.h"

#include <csignal>
#include <utility>

#include <sys/epoll.h>
#include <sys/signalfd.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

sigset_t watchedSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGUSR1);
  return signals;
}

}  // namespace

void SignalWatch::block() {
  const sigset_t signals = watchedSignals();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

SignalWatch::SignalWatch(std::function<void()> onEnd, std::function<void()> onReport)
    : onEnd_(std::move(onEnd)), onReport_(std::move(onReport)) {
  const sigset_t signals = watchedSignals();
  fd_.reset(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
}

bool SignalWatch::start(EventLoop& loop) { return fd_ && loop.watch(fd_.get(), EPOLLIN, *this); }

void SignalWatch::onReady(std::uint32_t /*events*/) {
  signalfd_siginfo signal{};
  if (read(fd_.get(), &signal, sizeof signal) != sizeof signal) return;
  if (signal.ssi_signo != SIGUSR1) {
    onEnd_();
  } else if (onReport_) {
    onReport_();
  }
}

}  // namespace halvox::platform::linux_
