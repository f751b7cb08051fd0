#pragma once

#include <optional>
#include <string_view>
#include <utility>

#include "platform/inline_function.h"
#include "platform/value.h"

namespace halvox::platform {

// The payload of an event: the entries of a dictionary and, after them, at most one more. Each
// event of a message adds an entry to those of the message. The entry is stored apart from them,
// because adding it would copy the message for each event, and hide from the service that the
// events of a message share its entries.
class AnalyticsPayload {
 public:
  AnalyticsPayload(Dictionary entries = {}) : entries_(std::move(entries)) {}
  // `entries` must not have the key of `added`.
  AnalyticsPayload(Dictionary entries, Dictionary::Entry added)
      : entries_(std::move(entries)), added_(std::move(added)) {}

  [[nodiscard]] const Dictionary& entries() const { return entries_; }
  // The entry after those of entries(), or null.
  [[nodiscard]] const Dictionary::Entry* added() const { return added_ ? &*added_ : nullptr; }
  // All entries, in order.
  [[nodiscard]] Dictionary dictionary() const {
    Dictionary all = entries_;
    if (added_) all.add(added_->key, added_->value);
    return all;
  }
  // The value under a key, or null. It is part of this payload.
  [[nodiscard]] const Value* find(const Key& key) const {
    return added_ && added_->key == key ? &added_->value : entries_.find(key);
  }

 private:
  Dictionary entries_;
  std::optional<Dictionary::Entry> added_;
};

// Builds the payload of one event. The service calls the builder on a thread of its own, perhaps
// after sendAnalyticsEventLazy() has returned. It never calls the builder of an event that it
// drops. The builder must own everything that it reads, because captures by reference could dangle
// by then. A message and its session fit inside, and are queued without an allocation.
using AnalyticsPayloadBuilder = InlineFunction<AnalyticsPayload(), 40>;

// Collects named events.
//
// A sender first tests the name of the event, which is cheap. It then passes a builder for the
// payload, which runs on another thread. Building and encoding a payload is expensive, and not
// every event is collected.
//
// Any thread may call. The composition root owns the service. A failure of storage is not reported
// to the caller. The service counts the events that it drops, and logs them.
class AnalyticsService {
 public:
  virtual ~AnalyticsService() = default;

  // True if anyone collects events of that name. The test must be cheap, because senders make it
  // for every message.
  [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;

  // Records one event. The service records the events of one thread in the order of its calls. The
  // call does not wait until the event is on the disk. While the service holds its maximum of
  // pending events, the call blocks, because slowing the sender keeps memory bounded without losing
  // events.
  virtual void sendAnalyticsEventLazy(std::string_view eventName,
                                      AnalyticsPayloadBuilder builder) = 0;
};

}  // namespace halvox::platform
