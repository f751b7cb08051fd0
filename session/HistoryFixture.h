#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"
#include "session/MessageHistory.h"

namespace halvox {

// A message of a history, as it was read.
struct RecordedMessage {
  std::string identifier;
  platform::Dictionary message;
};

// All messages of a history in order.
inline std::vector<RecordedMessage> messagesOf(const MessageHistory& history) {
  std::vector<RecordedMessage> messages;
  MessageHistory::Reader reader(history);
  while (const MessageHistory::Entry* entry = reader.next()) {
    messages.push_back({entry->identifier(), entry->message()});
  }
  EXPECT_EQ(reader.error(), std::nullopt);
  return messages;
}

}  // namespace halvox
