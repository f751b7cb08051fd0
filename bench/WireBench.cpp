// The cost of each step of reading a message from the wire and answering it.

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "platform/linux/connection/wire/testdata/GoldenFrames.h"
#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

// Returns the frame of a message with ten fields.
std::string sendMessageFrame(bool bigEndian) {
  const auto* golden = std::ranges::find_if(kGoldenFrames, [&](const GoldenFrame& frame) {
    return frame.name == "send_message" && frame.bigEndian == bigEndian;
  });
  return fromHex(golden->hex);
}

void measureHeader(benchmark::State& state) {
  const std::string bytes = sendMessageFrame(false);
  for (auto _ : state) benchmark::DoNotOptimize(measureFrame(asBytes(bytes), kMaxMessageBytes));
}
BENCHMARK(measureHeader);

void readHeader(benchmark::State& state) {
  const std::string bytes = sendMessageFrame(false);
  for (auto _ : state) benchmark::DoNotOptimize(readFrame(asBytes(bytes)));
}
BENCHMARK(readHeader);

// Everything from the bytes to the values, including the destruction of the values.
void readAndDecodeTenFields(benchmark::State& state) {
  const std::string bytes = sendMessageFrame(state.range(0) == 1);
  std::vector<Value> arguments;
  DecodeScratch scratch{.caches = std::make_unique<DecodeCaches>()};
  for (auto _ : state) {
    const auto result = readFrame(asBytes(bytes));
    const auto error = decodeBody(std::get<Frame>(result), "a{sv}uqaax", arguments, scratch);
    if (error.has_value()) state.SkipWithError(error->message.c_str());
    benchmark::DoNotOptimize(arguments.data());
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(bytes.size()) * state.iterations());
}
BENCHMARK(readAndDecodeTenFields)->ArgName("big_endian")->Arg(0)->Arg(1);

void writeBooleanReply(benchmark::State& state) {
  std::string out;
  for (auto _ : state) {
    out.clear();
    benchmark::DoNotOptimize(appendMethodReturn(out, {1, {}}, 2, "b", true));
  }
}
BENCHMARK(writeBooleanReply);

void writeDictionaryReply(benchmark::State& state) {
  const std::string bytes = sendMessageFrame(false);
  std::vector<Value> arguments;
  const auto result = readFrame(asBytes(bytes));
  if (decodeBody(std::get<Frame>(result), "a{sv}uqaax", arguments)) state.SkipWithError("frame");
  std::string out;
  for (auto _ : state) {
    out.clear();
    benchmark::DoNotOptimize(appendMethodReturn(out, {1, {}}, 2, "a{sv}", arguments.front()));
  }
}
BENCHMARK(writeDictionaryReply);

}  // namespace
}  // namespace halvox::platform::linux_::dbus
