#include "session/SummaryEvent.h"

#include <algorithm>

#include "platform/value_description.h"
#include "session/SessionLog.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Key;
using platform::Value;

const Key kServiceTypeKey("HV_Session_Summary_Event");

}  // namespace

// A message may use this key too. Its values then follow the service type.
SummaryEvent::SummaryEvent(AudioServiceType serviceType) {
  append(columns_[positionOf(kServiceTypeKey)], number(serviceType));
}

void SummaryEvent::add(const MessageHistory::Entry& entry) {
  const Dictionary& message = entry.message();
  const std::optional<std::uint32_t> form = entry.form();
  if (!form.has_value()) {
    for (const Dictionary::Entry& one : message) {
      Column& column = columns_[positionOf(one.key)];
      append(column, one.value);
      column.form.reset();
    }
    return;
  }
  const Positions& positions = positionsOf(*form, message);
  for (std::size_t at = 0; at < positions.size(); ++at) {
    Column& column = columns_[positions[at]];
    // An unchanged value is the same as in the previous message of the form. Messages of other
    // forms may have added others to the column since.
    if (column.form == form && !entry.isChanged(at)) {
      ++column.repetitions;
      continue;
    }
    append(column, message.begin()[at].value);
    column.form = form;
  }
}

void SummaryEvent::append(Column& column, const Value& value) {
  if (!column.isEmpty && column.last.isIdenticalTo(value)) {
    ++column.repetitions;
    return;
  }
  writeRepetitions(column);
  if (!column.isEmpty) column.text += ',';
  column.isEmpty = false;
  column.lastBegin = column.text.size();
  platform::appendDescription(column.text, value);
  column.last = value;
}

// Copies what is there, doubling it each time.
void SummaryEvent::writeRepetitions(Column& column) {
  if (column.repetitions == 0) return;
  std::string& text = column.text;
  const std::size_t begin = column.lastBegin;
  const std::size_t length = text.size() - begin;
  std::size_t missing = (length + 1) * column.repetitions;
  column.repetitions = 0;
  text += ',';
  --missing;
  while (missing > 0) {
    const std::size_t count = std::min(text.size() - begin, missing);
    text.append(text, begin, count);
    missing -= count;
  }
  column.lastBegin = text.size() - length;
}

std::uint32_t SummaryEvent::positionOf(const Key& key) {
  const auto [place, isNew] =
      positions_.try_emplace(key, static_cast<std::uint32_t>(columns_.size()));
  if (isNew) columns_.push_back({.key = key});
  return place->second;
}

const SummaryEvent::Positions& SummaryEvent::positionsOf(std::uint32_t form,
                                                         const Dictionary& message) {
  if (positionsOfForms_.size() <= form) positionsOfForms_.resize(form + std::size_t{1});
  Positions& positions = positionsOfForms_[form];
  if (positions.empty()) {
    for (const Dictionary::Entry& entry : message) positions.push_back(positionOf(entry.key));
  }
  return positions;
}

Dictionary SummaryEvent::take() {
  positions_.clear();
  positionsOfForms_.clear();
  Dictionary event;
  event.reserve(columns_.size());
  for (Column& column : columns_) {
    writeRepetitions(column);
    event.set(column.key, Value(column.text));
    std::string().swap(column.text);  // frees each large text before the next one is copied
  }
  columns_.clear();
  return event;
}

}  // namespace halvox
