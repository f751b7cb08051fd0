#include "client/SessionTable.h"

#include <algorithm>

#include "client/Overloaded.h"

namespace halvox::client {

void SessionTable::apply(const SessionOperation& operation) {
  if (std::holds_alternative<CreateSession>(operation.step)) {
    Session& session = sessions_[operation.id];
    setRunning(session, false);
    session = {.order = created_++, .type = {}, .configuration = {}};
    return;
  }
  const auto found = sessions_.find(operation.id);
  if (found == sessions_.end()) return;
  Session& session = found->second;
  std::visit(
      Overloaded{
          [](const CreateSession&) {},  // handled above
          [&](ServiceType type) { session.type = type; },
          [&](const Dictionary& configuration) { session.configuration.merge(configuration); },
          [&](const StartSession&) { setRunning(session, true); },
          [&](const StopSession&) { setRunning(session, false); },
          [&](const DestroySession&) {
            setRunning(session, false);
            sessions_.erase(found);
          },
      },
      operation.step);
}

void SessionTable::setRunning(Session& session, bool running) {
  if (session.running == running) return;
  session.running = running;
  if (running) {
    ++running_;
  } else {
    --running_;
  }
}

std::vector<SessionOperation> SessionTable::remake() const {
  std::vector<const decltype(sessions_)::value_type*> inOrder;
  inOrder.reserve(sessions_.size());
  for (const auto& entry : sessions_) inOrder.push_back(&entry);
  std::ranges::sort(inOrder, {}, [](const auto* entry) { return entry->second.order; });

  std::vector<SessionOperation> operations;
  for (const auto* entry : inOrder) {
    const auto& [id, session] = *entry;
    operations.push_back({id, CreateSession{}});
    if (session.type) operations.push_back({id, *session.type});
    if (!session.configuration.empty()) operations.push_back({id, session.configuration});
    if (session.running) operations.push_back({id, StartSession{}});
  }
  return operations;
}

}  // namespace halvox::client
