#include "reporters/pipewire/NodeDirectory.h"

#include <algorithm>
#include <utility>

#include "reporters/pipewire/StreamValues.h"

namespace halvox::pipewire_reporter {

void NodeDirectory::set(GlobalID id, std::uint64_t serial, const Properties& properties) {
  if (nodes_.size() >= kMaxNodes && !nodes_.contains(id)) return;
  nodes_.insert_or_assign(
      id, Node{.id = id,
               .serial = serial,
               .name = nodeName(properties, serial),
               .process = cleanText(property(properties, "application.process.binary"))});
}

void NodeDirectory::remove(GlobalID id) {
  const auto found = nodes_.find(id);
  if (found == nodes_.end()) return;
  if (gone_.size() == kMaxGone) gone_.pop_front();
  gone_.push_back(std::move(found->second));
  nodes_.erase(found);
}

void NodeDirectory::clear() {
  nodes_.clear();
  gone_.clear();
}

LateNode NodeDirectory::describe(GlobalID id, std::string_view name) const {
  std::string clean = cleanText(name);
  const auto matches = [&](const Node& node) {
    return node.id == id && (clean.empty() || node.name == clean);
  };
  const auto describeNode = [](const Node& node) {
    return LateNode{
        .id = node.id, .name = node.name, .serial = node.serial, .process = node.process};
  };
  if (const auto found = nodes_.find(id); found != nodes_.end() && matches(found->second)) {
    return describeNode(found->second);
  }
  const auto gone = std::find_if(gone_.rbegin(), gone_.rend(), matches);
  if (gone != gone_.rend()) return describeNode(*gone);
  return {.id = id, .name = std::move(clean)};
}

}  // namespace halvox::pipewire_reporter
