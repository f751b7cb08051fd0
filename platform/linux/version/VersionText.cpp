#include "platform/linux/version/VersionText.h"

#include "platform/linux/runtime/Version.h"

namespace halvox::platform::linux_ {
namespace {

// The build defines each of these as 0 or 1.
constexpr OptionalPart kServiceParts[] = {
    {"ALSA counters", "HALVOX_ALSA", HALVOX_HAS_ALSA != 0},
    {"PipeWire counters", "HALVOX_PIPEWIRE", HALVOX_HAS_PIPEWIRE != 0},
    {"NATS link", "HALVOX_NATS", HALVOX_HAS_NATS != 0},
    {"LTTng trace points", "HALVOX_WITH_LTTNG", HALVOX_HAS_TRACE_POINTS != 0},
    {"LTTng traces", "HALVOX_TRACING", HALVOX_HAS_TRACING != 0},
};

void appendParts(std::string& text, std::string_view heading, std::span<const OptionalPart> parts,
                 bool areBuilt) {
  std::string names;
  for (const OptionalPart& part : parts) {
    if (part.isBuilt != areBuilt) continue;
    if (!names.empty()) names += ", ";
    names += part.name;
  }
  if (names.empty()) return;
  text += "\n";
  text += heading;
  text += names;
}

}  // namespace

std::string versionText(std::string_view program, std::string_view commit,
                        std::span<const OptionalPart> parts) {
  std::string text(program);
  text += " ";
  text += halvoxVersion();
  if (!commit.empty()) text += " (" + std::string(commit) + ")";
  appendParts(text, "Built with: ", parts, true);
  appendParts(text, "Built without: ", parts, false);
  return text;
}

std::span<const OptionalPart> serviceParts() { return kServiceParts; }

}  // namespace halvox::platform::linux_
