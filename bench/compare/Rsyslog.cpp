#include "bench/compare/Rsyslog.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <stdexcept>
#include <thread>
#include <vector>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include "bench/client/RawClient.h"
#include "platform/linux/base/ErrnoText.h"

namespace halvox::bench {
namespace {

using std::chrono::milliseconds;

std::string configuration(const std::string& directory, const std::string& socket,
                          const std::string& file) {
  return "global(workDirectory=\"" + directory + "\")\n" +
         R"(module(load="imuxsock" SysSock.Use="off")
template(name="json" type="list" option.jsonf="on") {
  property(outname="time" name="timegenerated" dateFormat="rfc3339" format="jsonf")
  property(outname="name" name="programname" format="jsonf")
  property(outname="payload" name="msg" position.from="2" format="jsonf")
}
)" + "input(type=\"imuxsock\" CreatePath=\"off\" RateLimit.Interval=\"0\" Socket=\"" +
         socket + "\")\naction(type=\"omfile\" template=\"json\" file=\"" + file + "\")\n";
}

}  // namespace

Rsyslog::Rsyslog() : socket_(directory_.path("log")), file_(directory_.path("messages.json")) {
  const std::string config = directory_.path("rsyslog.conf");
  std::ofstream(config) << configuration(directory_.path("."), socket_, file_);
  process_ = std::make_unique<Process>(
      std::vector<std::string>{"/usr/sbin/rsyslogd", "-n", "-iNONE", "-f", config},
      std::vector<std::string>{});
  for (int attempt = 0; ::access(socket_.c_str(), F_OK) != 0; ++attempt) {
    if (attempt == 1000) throw std::runtime_error("rsyslogd does not open its socket");
    std::this_thread::sleep_for(milliseconds(10));
  }
}

void Rsyslog::waitForLines(std::int64_t count) {
  std::vector<char> piece(std::size_t{1} << 20U);
  auto last = std::chrono::steady_clock::now();
  while (lines_ < count) {
    std::ifstream file(file_);
    file.seekg(static_cast<std::streamoff>(offset_));
    file.read(piece.data(), static_cast<std::streamsize>(piece.size()));
    const std::streamsize size = file.gcount();
    if (size > 0) {
      lines_ += std::count(piece.begin(), piece.begin() + size, '\n');
      offset_ += static_cast<std::uint64_t>(size);
      last = std::chrono::steady_clock::now();
    } else if (std::chrono::steady_clock::now() - last > std::chrono::minutes(1)) {
      throw std::runtime_error("rsyslogd wrote only " + std::to_string(lines_) + " of " +
                               std::to_string(count) + " messages");
    } else {
      std::this_thread::sleep_for(milliseconds(5));
    }
  }
}

void Rsyslog::send(std::int64_t count, bool variesTexts) const {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socket_.copy(address.sun_path, sizeof address.sun_path - 1);
  const int fd = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  if (::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("connect: " + platform::linux_::errnoText(errno));
  }
  std::array<char, 512> text{};
  for (std::int64_t number = 0; number < count; ++number) {
    const int size =
        std::snprintf(text.data(), text.size(),
                      R"(<14>audio: {"frame_counter":%lld,"sample_rate":48000.0,"channels":2,)"
                      R"("io_buffer_frames":512,"is_running":true,"volume":0.75,"route":"%s",)"
                      R"("format":"lpcm/float32","device_uid":"%s","latency_ms":10.67})",
                      static_cast<long long>(number),
                      variesTexts ? RawClient::mixedText(number, 12).c_str() : "Speaker",
                      variesTexts ? RawClient::mixedText(number + 1, 42).c_str()
                                  : "alsa_output.pci-0000_00_1f.3.analog-stereo");
    if (::send(fd, text.data(), static_cast<std::size_t>(size), 0) != size) {
      throw std::runtime_error("send: " + platform::linux_::errnoText(errno));
    }
  }
  ::close(fd);
}

}  // namespace halvox::bench
