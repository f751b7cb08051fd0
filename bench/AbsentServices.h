#pragma once

#include <memory>
#include <utility>

#include "platform/diagnostic_reporter.h"
#include "platform/files.h"
#include "platform/ioreport.h"
#include "platform/ktrace.h"
#include "platform/metrics.h"
#include "platform/notify.h"
#include "platform/performance_trace.h"
#include "platform/power_log.h"
#include "platform/preferences.h"
#include "platform/property_list.h"
#include "platform/results_file.h"
#include "platform/tlm_reporting.h"

namespace halvox::bench {

using platform::AILDiagnosticReporter;
using platform::Data;
using platform::DiagnosticReporterService;
using platform::Dictionary;
using platform::DispatchQueue;
using platform::Error;
using platform::FileService;
using platform::IOReportError;
using platform::IOReportService;
using platform::JsonArrayFile;
using platform::KQTraceConfig;
using platform::KQTraceSession;
using platform::KQTraceSessionDelegate;
using platform::KtraceService;
using platform::KtraceSession;
using platform::MetricService;
using platform::NotifyService;
using platform::NotifyStatus;
using platform::NotifyToken;
using platform::PerformanceTraceService;
using platform::PowerLogService;
using platform::PreferenceService;
using platform::PropertyListService;
using platform::ProtoBase;
using platform::ResultsFileService;
using platform::ssunit;
using platform::Sswriter;
using platform::TLMReportingMessage;
using platform::TLMReportingOutcome;
using platform::TLMReportingService;
using platform::TLMReportingSession;
using platform::TLMSecureHierarchyToken;
using platform::Value;

// Services that do nothing: they discard what they receive, and return no value or an error. For
// benchmarks.

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

// Refuses every registration. The service logs that and runs without notifications.
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
                           std::optional<std::string_view>,
                           const std::optional<Dictionary>&) const override {
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

// A file that cannot be committed, because no disk is to be measured.
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

// Finds no back-end, at once and on the caller's thread, unlike a real link. Accepts no message.
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

class AbsentIOReport final : public IOReportService {
 public:
  Channels IOReportCopyChannelsInGroup(Name, Name, std::optional<IOReportError>&) override {
    return nullptr;
  }
  std::int32_t IOReportGetChannelCount(const Channels&) const override { return 0; }
  Subscription IOReportCreateSubscription(const Channels&, Channels&,
                                          std::optional<IOReportError>&) override {
    return nullptr;
  }
  Moment makeMoment() override { return std::make_unique<platform::IOReportMoment>(); }
  Samples IOReportCreateSamples(const Subscription&, const Channels&, platform::IOReportMoment&,
                                std::optional<IOReportError>&) override {
    return nullptr;
  }
  Samples IOReportCreateSamplesDelta(const Samples&, const Samples&,
                                     std::optional<IOReportError>&) override {
    return nullptr;
  }
  void IOReportIterate(const Samples&, const Visitor&) const override {}
};

// Nothing can be recorded. An end completes at once, so that no stop waits.
class AbsentKtrace final : public KtraceService {
 public:
  Session ktrace_session_create() override { return std::make_shared<KtraceSession>(); }
  void ktrace_set_completion_handler(const Session&, std::function<void()> handler) override {
    completion_ = std::move(handler);
  }
  void ktrace_set_walltimes_enabled(const Session&, bool) override {}
  int ktrace_events_range(const Session&, std::uint32_t, std::uint32_t, EventHandler) override {
    return 1;
  }
  int ktrace_start(const Session&, std::shared_ptr<DispatchQueue>) override { return 1; }
  void ktrace_end(const Session&, int) override { completion_(); }
  void ktrace_session_destroy(const Session&) override {}
  std::uint64_t ktrace_convert_timestamp_to_nanoseconds(const Session&,
                                                        std::uint64_t timestamp) const override {
    return timestamp;
  }

 private:
  std::function<void()> completion_;
};

class AbsentPropertyLists final : public PropertyListService {
 public:
  std::string currentDirectory() const override { return "/"; }
  std::optional<Data> readFile(std::string_view, std::optional<Error>&) const override {
    return std::nullopt;
  }
  std::optional<Value> parse(const std::optional<Data>&, std::optional<Error>&) const override {
    return std::nullopt;
  }
};

class AbsentResultsFiles final : public ResultsFileService {
 public:
  Writer sswriter_open(std::string_view, std::string_view, std::uint32_t, std::uint32_t) override {
    return nullptr;
  }
  void sswriter_new_value(Sswriter&, std::string_view, ssunit, double) override {}
  void sswriter_close(Writer) override {}
};

// Fails to start at once, and never completes.
class AbsentTraceSession final : public KQTraceSession {
 public:
  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override {
    if (const auto delegate = delegate_.lock()) delegate->kqTraceDidStart(Error{});
  }
  void stopKQTrace() override {}

 private:
  std::weak_ptr<KQTraceSessionDelegate> delegate_;
};

class AbsentPerformanceTraces final : public PerformanceTraceService {
 public:
  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t) override {
    return std::make_shared<KQTraceConfig>();
  }
  std::shared_ptr<KQTraceSession> initWithConfig(std::shared_ptr<KQTraceConfig>) override {
    return std::make_shared<AbsentTraceSession>();
  }
};

}  // namespace halvox::bench
