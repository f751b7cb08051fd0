#pragma once

#include <memory>
#include <utility>

#include "platform/diagnostic_reporter.h"
#include "platform/files.h"
#include "platform/metrics.h"
#include "platform/notify.h"
#include "platform/power_log.h"
#include "platform/preferences.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform {

// Services of which there is nothing: what is given to them goes nowhere and nothing comes from
// them.

class AbsentPreferences final : public PreferenceService {
 public:
  std::optional<Value> CFPreferencesCopyValue(std::string_view, std::string_view,
                                              std::string_view) const override {
    return std::nullopt;
  }
  std::optional<Value> suiteValue(std::string_view, std::string_view) const override {
    return std::nullopt;
  }
};

class AbsentNotify final : public NotifyService {
 public:
  NotifyStatus notify_register_dispatch(std::string_view, NotifyToken&,
                                        std::shared_ptr<DispatchQueue>, Handler) override {
    return 1;
  }
};

class AbsentMetrics final : public MetricService {
 public:
  void postIssueMetric(std::uint32_t, const ProtoBase&) override {}
};

class AbsentPowerLog final : public PowerLogService {
 public:
  void logPowerEvent(std::uint32_t, std::string_view, const Dictionary&,
                     const std::optional<Dictionary>&) override {}
};

class AbsentDiagnosticReporter final : public AILDiagnosticReporter {
 public:
  Dictionary makeSignature(std::string_view, std::string_view, std::string_view, std::string_view,
                           std::string_view, const std::optional<Dictionary>&) const override {
    return {};
  }
  void requestSnapshot(const Dictionary&, double, const std::optional<Dictionary>&,
                       const std::optional<Dictionary>&, Reply) override {}
};

class AbsentDiagnosticReporters final : public DiagnosticReporterService {
 public:
  std::shared_ptr<AILDiagnosticReporter> createReporter() override {
    return std::make_shared<AbsentDiagnosticReporter>();
  }
  void setStateSource(StateSource) override {}
};

class AbsentJsonArrayFile final : public JsonArrayFile {
 public:
  void appendObject(std::string_view, const Dictionary&) override {}
  std::optional<Error> commit(std::string&) override { return Error{}; }
};

class AbsentFiles final : public FileService {
 public:
  std::optional<Error> createDirectory(std::string_view, std::uint32_t) override { return Error{}; }
  std::unique_ptr<JsonArrayFile> createJsonArrayFile(std::string_view, std::string_view) override {
    return std::make_unique<AbsentJsonArrayFile>();
  }
};

class AbsentTlmReportingSession final : public TLMReportingSession {
 public:
  std::string description() const override { return "none"; }
};

class AbsentTlmReporting final : public TLMReportingService {
 public:
  Token TLMHierarchyTokenCreate() override {
    return std::make_shared<TLMSecureHierarchyToken>("none");
  }
  Session TLMReportingCreateSession(const Dictionary&, const Dictionary&) override {
    return std::make_shared<AbsentTlmReportingSession>();
  }
  void TLMReportingStartConfiguration(const Session&, BackendsCallback found) override {
    found(std::nullopt);
  }
  TLMReportingOutcome TLMReportingSendMessage(const Session&, const TLMReportingMessage&) override {
    return {};
  }
  void TLMReportingFlushMessages(const Session&, std::function<void()> flushed) override {
    flushed();
  }
  TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary&, const Dictionary&,
                                                 const TLMReportingMessage&) override {
    return {};
  }
};

}  // namespace halvox::platform
