#include "platform/linux/pipewire/testing/PrivatePipeWire.h"

#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <numbers>
#include <stdexcept>

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

PipedProcess::PipedProcess(const std::vector<std::string>& command) {
  auto input = platform::linux_::makePipe();
  if (!input) throw std::runtime_error(input.error().message);
  auto output = platform::linux_::makePipe();
  if (!output) throw std::runtime_error(output.error().message);
  // The event loop of a test blocks SIGTERM and SIGINT, and the child must not inherit that.
  auto child = platform::linux_::ChildProcess::start(
      {.command = command,
       .descriptors = {{.number = STDIN_FILENO, .ours = input->reader.get()},
                       {.number = STDOUT_FILENO, .ours = output->writer.get()}}});
  if (child) child_ = *std::move(child);
  input_ = std::move(input->writer);
  output_ = std::move(output->reader);
}

PipedProcess::~PipedProcess() {
  signal(SIGTERM);
  input_.reset();
  wait();
}

void PipedProcess::writeLine(const std::string& line) const {
  const std::string text = line + '\n';
  [[maybe_unused]] const auto written = write(input_.get(), text.data(), text.size());
}

std::string PipedProcess::readLine() const {
  std::string line;
  char letter = 0;
  while (read(output_.get(), &letter, 1) == 1 && letter != '\n') {
    line += letter;
  }
  return line;
}

void PipedProcess::signal(int number) const {
  if (child_) child_->signal(number);
}

int PipedProcess::wait() { return child_ ? child_->wait().status : -1; }

std::string PrivatePipeWire::missingTools() {
  return PipedProcess({HALVOX_PRIVATE_PIPEWIRE, "check"}).readLine();
}

PrivatePipeWire::PrivatePipeWire() {
  server_ = std::make_unique<PipedProcess>(
      std::vector<std::string>{HALVOX_PRIVATE_PIPEWIRE, "serve", directory()});
  ready_ = server_->readLine() == "ready";
  if (ready_) {
    enterEnvironment();
  }
}

PrivatePipeWire::~PrivatePipeWire() = default;

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
  std::string path = scratch_.path("tone.wav");
  std::ofstream(path, std::ios::binary) << makeWave(samples);
  return path;
}

void PrivatePipeWire::enterEnvironment() const {
  std::ifstream file(scratch_.path("environment"));
  for (std::string line; std::getline(file, line);) {
    const auto equals = line.find('=');
    setenv(line.substr(0, equals).c_str(), line.substr(equals + 1).c_str(), 1);
  }
  for (const char* name : {"PIPEWIRE_REMOTE", "PIPEWIRE_RUNTIME_DIR"}) {
    unsetenv(name);
  }
}

}  // namespace halvox::pipewire_testing
