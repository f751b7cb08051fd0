#pragma once

#include <memory>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {

// A started session without the link.
class SummaryFixture : public testing::Test {
 protected:
  SummaryFixture() {
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->start();
  }

  void send(const platform::Dictionary& message) {
    session_->sendMessage(message, AudioEventCategory::kPlayback, AudioEventType::kStart, nullptr);
  }
  void playing(double volume, double stamp) { sendVolume(volume, 1, stamp); }
  void silent(double stamp) { sendVolume(0.75, 0, stamp); }
  void playTwoVolumes() {
    playing(0.5, 10);
    playing(0.75, 20);
    silent(25);
  }
  void sendVolume(double volume, int state, double stamp) {
    send({{"RQSessionVolume", volume},
          {"RQSessionVolumePlayingState", state},
          {"hvreporting_timestamp", stamp}});
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

}  // namespace halvox
