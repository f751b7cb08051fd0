#include "platform/linux/pipewire/testing/PrivatePipeWire.h"

#include <array>
#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <numbers>
#include <system_error>

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace halvox::pipewire_testing {
namespace {

constexpr std::uint32_t kRate = 48000;

template <typename Number>
void append(std::string& bytes, Number number) {
  for (std::size_t i = 0; i < sizeof number; ++i) {
    bytes += static_cast<char>(static_cast<std::uint64_t>(number) >> 8U * i & 0xFFU);
  }
}

// Returns a mono WAV file with 16-bit samples.
std::string makeWave(const std::string& samples) {
  std::string file = "RIFF";
  append(file, static_cast<std::uint32_t>(36 + samples.size()));
  file += "WAVEfmt ";
  append(file, std::uint32_t{16});
  append(file, std::uint16_t{1});
  append(file, std::uint16_t{1});
  append(file, kRate);
  append(file, kRate * 2);
  append(file, std::uint16_t{2});
  append(file, std::uint16_t{16});
  file += "data";
  append(file, static_cast<std::uint32_t>(samples.size()));
  return file + samples;
}

}  // namespace

ChildProcess::ChildProcess(const std::vector<std::string>& command) {
  std::array<int, 2> input{};
  std::array<int, 2> output{};
  if (pipe2(input.data(), O_CLOEXEC) != 0 || pipe2(output.data(), O_CLOEXEC) != 0) {
    throw std::system_error(errno, std::generic_category(), "pipe");
  }
  posix_spawn_file_actions_t actions{};
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, input[0], STDIN_FILENO);
  posix_spawn_file_actions_adddup2(&actions, output[1], STDOUT_FILENO);
  // Unblock all signals: the event loop blocks SIGTERM and SIGINT, and children inherit that.
  sigset_t noSignals;
  sigemptyset(&noSignals);
  posix_spawnattr_t attributes{};
  posix_spawnattr_init(&attributes);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  posix_spawnattr_setsigmask(&attributes, &noSignals);
  std::vector<char*> arguments;
  arguments.reserve(command.size() + 1);
  for (const auto& argument : command) {
    arguments.push_back(const_cast<char*>(argument.c_str()));
  }
  arguments.push_back(nullptr);
  const int error =
      posix_spawnp(&pid_, arguments[0], &actions, &attributes, arguments.data(), environ);
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  close(input[0]);
  close(output[1]);
  input_ = input[1];
  output_ = output[0];
  if (error != 0) {
    pid_ = -1;
  }
}

ChildProcess::~ChildProcess() {
  if (pid_ > 0) {
    kill(pid_, SIGTERM);
  }
  close(input_);
  wait();
  close(output_);
}

void ChildProcess::writeLine(const std::string& line) const {
  const std::string text = line + '\n';
  [[maybe_unused]] const auto written = write(input_, text.data(), text.size());
}

std::string ChildProcess::readLine() const {
  std::string line;
  char letter = 0;
  while (read(output_, &letter, 1) == 1 && letter != '\n') {
    line += letter;
  }
  return line;
}

void ChildProcess::signal(int number) const { kill(pid_, number); }

int ChildProcess::wait() {
  int status = -1;
  if (pid_ > 0) {
    waitpid(pid_, &status, 0);
    pid_ = -1;
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string PrivatePipeWire::missingTools() {
  return ChildProcess({HALVOX_PRIVATE_PIPEWIRE, "check"}).readLine();
}

PrivatePipeWire::PrivatePipeWire() {
  std::string name = std::filesystem::temp_directory_path() / "halvox-audio.XXXXXX";
  if (mkdtemp(name.data()) == nullptr) {
    throw std::system_error(errno, std::generic_category(), "mkdtemp");
  }
  directory_ = name;
  server_ = std::make_unique<ChildProcess>(
      std::vector<std::string>{HALVOX_PRIVATE_PIPEWIRE, "serve", directory_});
  ready_ = server_->readLine() == "ready";
  if (ready_) {
    enterEnvironment();
  }
}

PrivatePipeWire::~PrivatePipeWire() {
  server_.reset();
  std::filesystem::remove_all(directory_);
}

bool PrivatePipeWire::restart() const {
  server_->writeLine("restart");
  return server_->readLine() == "restarted";
}

std::string PrivatePipeWire::makeTone(double seconds) const {
  constexpr double kFrequency = 440;
  constexpr double kAmplitude = 16000;
  std::string samples;
  const auto count = static_cast<int>(seconds * kRate);
  for (int i = 0; i < count; ++i) {
    const double phase = 2 * std::numbers::pi * kFrequency * i / kRate;
    append(samples, static_cast<std::uint16_t>(std::lround(kAmplitude * std::sin(phase))));
  }
  std::string path = directory_ / "tone.wav";
  std::ofstream(path, std::ios::binary) << makeWave(samples);
  return path;
}

void PrivatePipeWire::enterEnvironment() const {
  std::ifstream file(directory_ / "environment");
  for (std::string line; std::getline(file, line);) {
    const auto equals = line.find('=');
    setenv(line.substr(0, equals).c_str(), line.substr(equals + 1).c_str(), 1);
  }
  for (const char* name : {"PIPEWIRE_REMOTE", "PIPEWIRE_RUNTIME_DIR"}) {
    unsetenv(name);
  }
}

}  // namespace halvox::pipewire_testing
