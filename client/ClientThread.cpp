#include "client/ClientThread.h"

#include <cerrno>
#include <cstddef>
#include <memory>
#include <system_error>
#include <utility>

namespace halvox::client {
namespace {

using Work = std::function<void()>;

// The size of the stack. It is enough for the program's connection handler, which runs on this
// thread.
constexpr std::size_t kStackBytes = std::size_t{512} * 1024;

void* runWork(void* argument) {
  const std::unique_ptr<Work> work(static_cast<Work*>(argument));
  (*work)();
  return nullptr;
}

}  // namespace

ClientThread::~ClientThread() {
  if (isRunning_) pthread_join(thread_, nullptr);
}

void ClientThread::start(std::function<void()> work) {
  auto owned = std::make_unique<Work>(std::move(work));
  pthread_attr_t attributes;
  pthread_attr_init(&attributes);
  pthread_attr_setstacksize(&attributes, kStackBytes);
  int error = pthread_create(&thread_, &attributes, &runWork, owned.get());
  pthread_attr_destroy(&attributes);
  if (error == EINVAL) error = pthread_create(&thread_, nullptr, &runWork, owned.get());
  if (error != 0) throw std::system_error(error, std::generic_category(), "pthread_create");
  static_cast<void>(owned.release());  // runWork() destroys it
  isRunning_ = true;
}

bool ClientThread::isCurrent() const { return pthread_equal(thread_, pthread_self()) != 0; }

}  // namespace halvox::client
