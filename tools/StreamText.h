#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "analysis/StreamStory.h"

#include "tools/TextTable.h"

// Stories of streams in words and as JSON. Texts of clients are escaped: they could control a
// terminal or reorder a line.
namespace halvox::tools {

// The columns of the table of streams, and a stream's row in it.
[[nodiscard]] std::vector<TextTable::Column> streamColumns();
[[nodiscard]] std::vector<std::string> streamRow(const analysis::StreamStory& story);

// A few lines about the whole stream, each with a line end.
[[nodiscard]] std::string describeStream(const analysis::StreamStory& story);
// One sentence about a moment of a stream. Empty for a moment that does not need one.
[[nodiscard]] std::string describeMoment(const analysis::StreamStory& story,
                                         const analysis::StreamMoment& moment);

// JSON objects on one line, without a line end. A stream that still runs has no "ended".
// With `momentsNotShown`, the stream has this number as "moments_not_shown".
[[nodiscard]] std::string streamJson(const analysis::StreamStory& story,
                                     std::optional<std::size_t> momentsNotShown = std::nullopt);
[[nodiscard]] std::string momentJson(const analysis::StreamMoment& moment);

// "4.6s", "12m34s", "1h02m03s".
[[nodiscard]] std::string durationText(double seconds);
// "2.1 ms", "469 ms", "12.3 s".
[[nodiscard]] std::string lostText(double milliseconds);

}  // namespace halvox::tools
