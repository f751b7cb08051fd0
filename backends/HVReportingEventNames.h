#pragma once

#include <array>
#include <cstddef>
#include <initializer_list>
#include <string_view>

#include "backends/HVReportingVocabulary.h"

namespace halvox {

// A name that is joined from parts without an allocation, because every message makes two names and
// most of them are only tested, never sent.
class HVReportingEventName {
 public:
  HVReportingEventName(std::initializer_list<std::string_view> parts) {
    for (const std::string_view part : parts) {
      length_ += part.copy(text_.data() + length_, text_.size() - length_);
    }
  }
  [[nodiscard]] std::string_view text() const { return {text_.data(), length_}; }

 private:
  // The longest name, with PlaybackAndRecord and HeadphoneAudioExposure, has 75 characters. A name
  // that does not fit would be cut: check this size when a text is added to the vocabulary.
  std::array<char, 128> text_;
  std::size_t length_ = 0;
};

// The names of the two events of a message. Pure: any thread may make them.
struct HVReportingEventNames {
  HVReportingEventNames(AudioEventCategory category, AudioEventType type,
                        AudioServiceType serviceType);

  HVReportingEventName ofAll;      // "com.tarno.halvox.Session_Playback.Start"
  HVReportingEventName ofService;  // "com.tarno.haptics.Session_Playback.Start"
};

}  // namespace halvox
