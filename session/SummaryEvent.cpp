#include "session/SummaryEvent.h"

#include <utility>

#include "session/SessionLog.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Key;
using platform::Value;

const Key kServiceTypeKey("HV_Session_Summary_Event");

void appendText(std::string& text, const Value& value) {
  if (value.isString()) {
    text += value.string();
  } else {
    text += platform::describe(value);
  }
}

}  // namespace

// A message may use this key too. Its values then follow the service type.
SummaryEvent::SummaryEvent(AudioServiceType serviceType) {
  append(columnOf(kServiceTypeKey), number(serviceType));
}

void SummaryEvent::add(const Dictionary& message) {
  for (const Dictionary::Entry& entry : message) {
    const std::size_t known = columns_.size();
    Column& column = columnOf(entry.key);
    if (columns_.size() == known) column.text += ',';
    append(column, entry.value);
  }
}

// Most values of a session repeat the previous one. Copying its text costs less than making it
// again.
void SummaryEvent::append(Column& column, const Value& value) {
  const std::size_t begin = column.text.size();
  if (begin > 0 && column.last.isIdenticalTo(value)) {
    const std::size_t end = begin - 1;  // before the comma
    column.text.append(column.text, column.lastBegin, end - column.lastBegin);
  } else {
    appendText(column.text, value);
    column.last = value;
  }
  column.lastBegin = begin;
}

SummaryEvent::Column& SummaryEvent::columnOf(const Key& key) {
  if (likely_ >= columns_.size() || !(columns_[likely_].key == key)) {
    const auto [place, isNew] = positions_.try_emplace(key, columns_.size());
    if (isNew) columns_.push_back({.key = key, .text = {}, .last = {}});
    likely_ = place->second;
  }
  return columns_[likely_++];
}

Dictionary SummaryEvent::take() {
  positions_.clear();
  Dictionary event;
  event.reserve(columns_.size());
  for (Column& column : columns_) {
    event.set(column.key, Value(column.text));
    std::string().swap(column.text);  // frees each large text before the next one is copied
  }
  columns_.clear();
  likely_ = 0;
  return event;
}

}  // namespace halvox
