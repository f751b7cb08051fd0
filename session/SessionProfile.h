#pragma once

#include <atomic>
#include <string_view>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/process.h"
#include "platform/value.h"
#include "session/Guarded.h"
#include "session/ResourceAccount.h"

namespace halvox {

// What a session is: its reporter ID, the processes that own it, its service type and its
// configuration.
//
// Owned by the session, whose link, traces and summary read it. Any thread may read and write; each
// access is indivisible. No operation fails.
class SessionProfile {
 public:
  using ProcessIdentifiers = std::vector<platform::ProcessID>;

  // Charges the configuration to `held`, which must outlive the profile.
  SessionProfile(ReporterID reporterID, ProcessIdentifiers processIdentifiers, ResourceTally& held);

  [[nodiscard]] ReporterID reporterID() const { return reporterID_; }
  [[nodiscard]] ProcessIdentifiers processIdentifiers() const { return processIdentifiers_.copy(); }
  void setProcessIdentifiers(ProcessIdentifiers identifiers);
  // The first process identifier; 0 if there is none.
  [[nodiscard]] platform::ProcessID ownerPid() const;

  [[nodiscard]] AudioServiceType serviceType() const {
    return serviceType_.load(std::memory_order_relaxed);
  }
  // Logs the new name.
  void setServiceType(AudioServiceType serviceType);
  // The name of the current service type, a constant of the vocabulary.
  [[nodiscard]] std::string_view serviceName() const;

  // The configuration at this moment, empty if none was set. Later changes do not alter the
  // returned dictionary.
  [[nodiscard]] platform::Dictionary configuration() const { return configuration_.copy(); }
  // Adds the entries of `configuration`. A new value replaces the old one; no key is ever removed.
  void mergeConfiguration(const platform::Dictionary& configuration);

 private:
  // Never changes, because maps are keyed by it.
  const ReporterID reporterID_;
  ResourceTally& held_;  // the session's
  Guarded<ProcessIdentifiers> processIdentifiers_;
  Guarded<platform::Dictionary> configuration_;
  std::atomic<AudioServiceType> serviceType_{AudioServiceType::kUnknown};  // orders nothing else
};

}  // namespace halvox
