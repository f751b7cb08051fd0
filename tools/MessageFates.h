#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "analysis/MessageJoin.h"

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox::tools {

// What the store shows about one message and the real-time link.
enum class LinkFate : std::uint8_t {
  kSession,        // the link took it in a session
  kSingle,         // the link took it outside a session
  kRepeats,        // no link message: it repeats a message that a session recorded before
  kMayRepeat,      // no link message: it repeats one as above, or a session without a link sent it
  kEqualsEvent,    // no link message: it equals the event before it, of which there is none either
  kTestSession,    // no link message: sessions of that type do not use the link
  kWithoutStamp,   // its event and its link message cannot be brought together
  kNotRecognised,  // no link message, and the store does not show why
};

struct MessageFate {
  const analysis::Message& message;  // valid during the callback only
  LinkFate link = LinkFate::kNotRecognised;
  // That took it, or that recorded the one that it repeats. Empty if the store does not show it: of
  // a repetition, if several sessions recorded an equal message; always of kMayRepeat.
  std::optional<std::int64_t> session{};
  // The message of the same category, type, application and service type with which it was
  // compared; 0 if there is none.
  std::int64_t previous = 0;
  bool isExempt = false;        // errors are never dropped as repetitions
  bool equalsPrevious = false;  // although a session recorded it
};

// Decides what became of stored messages, with the session's own comparison. A session's history is
// not stored. Of each application, service type, category and type, the newest message that each
// session recorded therefore stands for it; these are the messages that went through the link.
//
// Memory: messages of kMostBases kinds, of kMostSessions sessions each. When there are more, the
// comparison begins anew. Belongs to one thread.
class MessageFates {
 public:
  static constexpr std::size_t kMostBases = 4096;
  static constexpr std::size_t kMostSessions = 16;

  using Callback = std::function<void(const MessageFate&)>;
  // Calls `callback` from add().
  explicit MessageFates(Callback callback) : callback_(std::move(callback)) {}

  // Takes the next message in the order of storing.
  void add(const analysis::Message& message);

  // The message as a session compares it: without what the service adds to its records. Nothing if
  // it cannot be read back.
  [[nodiscard]] static std::optional<platform::Dictionary> comparable(const std::string& payload);
  // The numbers of names. A category without a number of its own is kUndefined.
  [[nodiscard]] static AudioEventCategory categoryOf(const std::string& name);
  [[nodiscard]] static AudioEventType typeOf(const std::string& name);

 private:
  struct Kept {
    std::int64_t id = 0;                  // of the message
    std::optional<std::int64_t> session;  // empty: of an event without a link message
    platform::Dictionary message;
  };
  using Base = std::vector<Kept>;  // the newest last

  Base& baseOf(const analysis::Message& message);
  void decide(const analysis::Message& message, const platform::Dictionary& content,
              const Base& base, MessageFate& fate) const;
  static void keep(Base& base, Kept kept);
  void forgetSession(std::int64_t session);

  Callback callback_;
  std::unordered_map<std::string, Base> bases_;
};

}  // namespace halvox::tools
