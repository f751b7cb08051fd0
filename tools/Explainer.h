#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "analysis/StoreRecordSource.h"

#include "tools/Complaint.h"
#include "tools/Explain.h"
#include "tools/ExplainText.h"
#include "tools/Explanation.h"
#include "tools/MessageFates.h"

namespace halvox::tools {

// Explains over one store: what halvoxctl explain prints, as values. Belongs to one thread, for one
// request. `request`, `complain` and `reader` must outlive it. Reports a failure to `complain`.
class Explainer {
 public:
  // What a number on the command line may mean.
  struct Found {
    struct Target {
      std::string name;
      std::string category;
      std::string type;
      std::string payload;
      double time = 0;
      analysis::RecordKind kind = analysis::RecordKind::kEvent;
    };
    std::optional<Target> record;
    bool isSession = false;
  };

  Explainer(const Explain& request, const Complaint& complain,
            platform::linux_::StoreReader& reader, ExplainSettings settings)
      : request_(request), complain_(complain), source_(reader), settings_(std::move(settings)) {}

  // Returns the explanations, or the exit status of a failure that was reported.
  std::variant<std::vector<Explanation>, ExitStatus> run(
      const std::function<std::string(std::int64_t)>& askService);

 private:
  using Outcome = std::variant<std::vector<Explanation>, ExitStatus>;

  // Reads records of the request's times. Reports a failure.
  std::optional<ExitStatus> read(analysis::RecordRange range,
                                 const analysis::RecordSource::Callback& callback);
  // Replays the messages that `isOf` accepts, and summaries.
  std::optional<ExitStatus> replay(
      const std::function<bool(const analysis::Record&)>& isOf,
      const MessageFates::Callback& onFate,
      const std::function<void(const analysis::Record&)>& onOther = {});

  Explanation finished(Explanation explanation) const;

  Outcome explainName();
  Outcome explainMessages(const MessageName& name);
  Outcome explainOther();
  Outcome explainNumber(std::int64_t number,
                        const std::function<std::string(std::int64_t)>& askService);
  std::variant<Found, ExitStatus> find(std::int64_t number);
  Outcome explainRecord(std::int64_t id, const Found::Target& target);
  Outcome explainSession(std::int64_t id, const std::string& answerOfService);

  const Explain& request_;
  const Complaint& complain_;
  analysis::StoreRecordSource source_;
  ExplainSettings settings_;
};

}  // namespace halvox::tools
