// Tests what audio threads rely on. Counts the system calls, allocations and locks of a thread that
// sends through the shared library, as a thread of a program does.

#include <atomic>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <fstream>
#include <memory>
#include <thread>

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <ucontext.h>
#include <unistd.h>

#include "client/EncodedDictionary.h"
#include "client/FrameRing.h"
#include "client/RequestEncoder.h"
#include "client/halvox.h"
#include "client/testing/TestService.h"

namespace {

// These calls are counted only on threads that ask for it.
thread_local bool counts = false;
thread_local int allocations = 0;
thread_local int locks = 0;
std::atomic<int> systemCalls{0};

void countAllocation() {
  if (counts) ++allocations;
}

}  // namespace

// All libraries in the process use these definitions of the program.
extern "C" {
void* __libc_malloc(std::size_t size);                     // NOLINT(bugprone-reserved-identifier)
void* __libc_calloc(std::size_t count, std::size_t size);  // NOLINT(bugprone-reserved-identifier)
void* __libc_realloc(void* memory, std::size_t size);      // NOLINT(bugprone-reserved-identifier)
void __libc_free(void* memory);                            // NOLINT(bugprone-reserved-identifier)

void* malloc(std::size_t size) {
  countAllocation();
  return __libc_malloc(size);
}
void* calloc(std::size_t count, std::size_t size) {
  countAllocation();
  return __libc_calloc(count, size);
}
void* realloc(void* memory, std::size_t size) {
  countAllocation();
  return __libc_realloc(memory, size);
}
void free(void* memory) {
  if (memory != nullptr) countAllocation();
  __libc_free(memory);
}
int pthread_mutex_lock(pthread_mutex_t* mutex) {
  using Lock = int (*)(pthread_mutex_t*);
  static const auto next = reinterpret_cast<Lock>(dlsym(RTLD_NEXT, "pthread_mutex_lock"));
  if (counts) ++locks;
  return next(mutex);
}
}

namespace {

using halvox::client::ScratchDirectory;
using halvox::client::TestService;

struct ClientFree {
  void operator()(halvox_client* client) const { halvox_client_free(client); }
};
struct DictionaryFree {
  void operator()(halvox_dictionary* dictionary) const { halvox_dictionary_free(dictionary); }
};

void onSystemCall(int /*signal*/, siginfo_t* /*info*/, void* context) {
  ++systemCalls;
  auto& registers = static_cast<ucontext_t*>(context)->uc_mcontext;
#if defined(__x86_64__)
  registers.gregs[REG_RAX] = -ENOSYS;
#elif defined(__aarch64__)
  registers.regs[0] = static_cast<std::uint64_t>(-ENOSYS);
#endif
}

// From here on, every system call of this thread fails and is counted, except the calls that end
// the thread.
bool trapSystemCalls() {
  struct sigaction action {};
  action.sa_sigaction = onSystemCall;
  action.sa_flags = SA_SIGINFO;
  sigaction(SIGSYS, &action, nullptr);
  sock_filter instructions[] = {
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_exit, 2, 0),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_rt_sigreturn, 1, 0),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_TRAP),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
  };
  const sock_fprog program{.len = std::size(instructions), .filter = instructions};
  return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
         prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

struct Counts {
  bool trapped = false;
  int systemCalls = 0;
  int allocations = 0;
  int locks = 0;
};

// Runs `work` on a new thread and counts its system calls, allocations and locks.
template <typename Work>
Counts count(const Work& work) {
  Counts result;
  std::thread([&] {
    // Allocate before counting begins, because the first allocation of a thread maps memory for the
    // thread.
    halvox_dictionary_free(halvox_dictionary_new());
    systemCalls = 0;
    result.trapped = trapSystemCalls();
    counts = true;
    work();
    counts = false;
    result.systemCalls = systemCalls;
    result.allocations = allocations;
    result.locks = locks;
  }).join();
  return result;
}

class RealTimeTest : public testing::Test {
 protected:
  RealTimeTest() : service_(scratch_.path("reporting.sock")) {
    const std::string path = scratch_.path("reporting.sock");
    halvox_options options{};
    options.size = sizeof options;
    options.socket_path = path.c_str();
    options.real_time = 1;
    client_.reset(halvox_client_new(&options));
    message_.reset(halvox_dictionary_new());
    halvox_dictionary_set_int64(message_.get(), "frame_counter", 1);
    halvox_dictionary_set_double(message_.get(), "sample_rate", 48000.0);
    halvox_dictionary_set_bool(message_.get(), "is_running", true);
    halvox_dictionary_set_string(message_.get(), "device_uid", "alsa_output.pci-0000_00_1f.3");
    halvox_client_create_session(client_.get(), 7);
    halvox_client_start(client_.get(), 7);
    EXPECT_EQ(halvox_client_flush(client_.get(), 20'000), HALVOX_OK);
  }

  void sendMany(int messages) const {
    const std::int64_t ids[] = {7, 8};
    for (int number = 0; number < messages; ++number) {
      halvox_client_send(client_.get(), 7, message_.get(), 4, 18);
      halvox_client_send_to(client_.get(), ids, 2, message_.get(), 4, 18);
      halvox_client_send_to_all(client_.get(), message_.get(), 4, 18);
    }
  }
  static void expectNothing(const Counts& counted) {
    ASSERT_TRUE(counted.trapped);
    EXPECT_EQ(counted.systemCalls, 0);
    EXPECT_EQ(counted.allocations, 0);
    EXPECT_EQ(counted.locks, 0);
  }
  [[nodiscard]] halvox_counters counters() const {
    halvox_counters now{};
    now.size = sizeof now;
    halvox_client_counters(client_.get(), &now);
    return now;
  }

  ScratchDirectory scratch_;
  TestService service_;
  std::unique_ptr<halvox_client, ClientFree> client_;
  std::unique_ptr<halvox_dictionary, DictionaryFree> message_;
};

// Without this test, the other tests could pass because nothing is counted.
TEST_F(RealTimeTest, SystemCallsAndAllocationsAreCounted) {
  const Counts counted = count([&] {
    syscall(SYS_getpid);
    halvox_dictionary_free(halvox_dictionary_new());
  });

  ASSERT_TRUE(counted.trapped);
  EXPECT_EQ(counted.systemCalls, 1);
  EXPECT_EQ(counted.allocations, 2);
}

TEST_F(RealTimeTest, LocksAreCounted) {
  locks = 0;
  counts = true;
  halvox_client_stop(client_.get(), 9);
  counts = false;

  EXPECT_GE(locks, 1);
}

TEST_F(RealTimeTest, SendingWhileASessionRunsMakesNoSystemCallAllocationOrLock) {
  expectNothing(count([&] { sendMany(1000); }));

  ASSERT_EQ(halvox_client_flush(client_.get(), 20'000), HALVOX_OK);
  EXPECT_EQ(counters().acknowledged, 3000U);
}

TEST_F(RealTimeTest, ChangingANumberAndSendingAgainAllocatesNothing) {
  expectNothing(count([&] {
    for (int number = 0; number < 1000; ++number) {
      halvox_dictionary_set_int64(message_.get(), "frame_counter", number);
      halvox_client_send(client_.get(), 7, message_.get(), 4, 18);
    }
  }));
}

TEST_F(RealTimeTest, AValueOfTheSameSizeReplacesTheOldOneWithoutAnAllocation) {
  halvox_dictionary_set_date(message_.get(), "since", 1.0);

  expectNothing(count([&] {
    for (int number = 0; number < 100; ++number) {
      halvox_dictionary_set_double(message_.get(), "sample_rate", number);
      halvox_dictionary_set_bool(message_.get(), "is_running", number % 2 == 0);
      halvox_dictionary_set_date(message_.get(), "since", number);
      halvox_dictionary_set_string(
          message_.get(), "device_uid",
          number % 2 == 0 ? "alsa_output.pci-0000_00_1f.4" : "alsa_output.pci-0000_00_1f.5");
      halvox_client_send(client_.get(), 7, message_.get(), 4, 18);
    }
  }));
}

TEST_F(RealTimeTest, SendingIntoAFullRingMakesNoneEither) {
  service_.setStalled(true);

  expectNothing(count([&] { sendMany(5000); }));

  EXPECT_GT(counters().dropped, 0U);
  service_.setStalled(false);
}

TEST_F(RealTimeTest, SendingWithoutAServiceMakesNoneEither) {
  service_.vanish();
  ASSERT_TRUE(
      halvox::client::eventually([&] { return !halvox_client_is_connected(client_.get()); }));

  expectNothing(count([&] { sendMany(1000); }));
}

std::int64_t pageFaults() {
  rusage usage{};
  getrusage(RUSAGE_THREAD, &usage);
  return usage.ru_minflt;
}

// More messages wait now than ever before. But the client's thread has run since there was little
// touched memory left, and has touched more.
TEST(RingMemoryTest, TheConsumerTouchesMemoryBeforeTheProducersNeedIt) {
  constexpr int kMessages = 400;  // one cell of 512 bytes each
  halvox::client::FrameRing ring(8192, std::size_t{4} << 20U);
  const halvox::client::EncodedDictionary message{};
  const halvox::client::EncodedMessageView view{std::nullopt, message, 4, 18};
  for (int number = 0; number < kMessages; ++number) ring.tryPush(view);
  ASSERT_TRUE(ring.isReady());
  ring.drop(ring.take());
  ring.release();

  const std::int64_t before = pageFaults();
  for (int number = 0; number < kMessages; ++number) ring.tryPush(view);

  EXPECT_EQ(ring.tail(), 2U * kMessages);
  EXPECT_LT(pageFaults() - before, 3);  // 36 if the consumer touches nothing
}

// Returns how many bytes of this process are resident.
std::size_t residentBytes() {
  std::size_t size = 0;
  std::size_t resident = 0;
  std::ifstream("/proc/self/statm") >> size >> resident;
  return resident * static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
}

// Audio programs lock their memory. The usual limit of locked memory is 8 MiB, and everything that
// a thread or a client maps counts towards it.
TEST(LockedMemoryTest, AClientLeavesMostOfTheUsualLimitToItsProgram) {
  constexpr int kCannotLock = 2;
  const pid_t child = fork();
  if (child == 0) {
    if (mlockall(MCL_CURRENT | MCL_FUTURE) != 0) _exit(kCannotLock);
    halvox_options options{};
    options.size = sizeof options;
    options.socket_path = "/nonexistent/socket";
    const std::size_t before = residentBytes();
    halvox_client* client = halvox_client_new(&options);
    const std::size_t taken = residentBytes() - before;
    _exit(client != nullptr && taken < std::size_t{6} << 20U ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status));
  if (WEXITSTATUS(status) == kCannotLock) GTEST_SKIP() << "this user may not lock memory";

  EXPECT_EQ(WEXITSTATUS(status), 0);
}

}  // namespace
