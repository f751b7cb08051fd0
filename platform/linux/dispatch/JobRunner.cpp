#include "platform/linux/dispatch/JobRunner.h"

#include <exception>
#include <string>

#include "platform/linux/dispatch/DispatchThread.h"

namespace halvox::platform::linux_ {

JobRunner::JobRunner(LogService& log, StatisticsService& statistics)
    : log_(log.createCategory("com.tarno.halvox", "dispatch")),
      failed_(statistics.counter("dispatch", "jobs that failed")),
      discarded_(statistics.counter("dispatch", "jobs discarded at the stop")) {}

void JobRunner::reportFailure() noexcept {
  failed_.add();
  std::string what = "an exception of an unknown kind";
  try {
    throw;
  } catch (const std::exception& exception) {
    what = exception.what();
  } catch (...) {
    // The exception is not a std::exception and has no text.
  }
  log_.write(LogLevel::kError, detail::logPrefix("JobRunner", __LINE__) + "a job of queue \"" +
                                   std::string(DispatchThread::current().label()) + "\" failed: " +
                                   what + "; the queue continues with its next job");
}

}  // namespace halvox::platform::linux_
