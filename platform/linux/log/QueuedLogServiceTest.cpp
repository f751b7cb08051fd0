#include "platform/linux/log/QueuedLogService.h"

#include <array>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/log/LogLineFormatter.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

struct Pipe {
  Pipe() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    reader.reset(ends[0]);
    writer.reset(ends[1]);
  }
  // Closes the end for writing and returns everything that was written.
  std::string readAll() {
    writer.reset();
    std::string text;
    std::array<char, 4096> buffer;
    for (ssize_t count = 0; (count = ::read(reader.get(), buffer.data(), buffer.size())) > 0;) {
      text.append(buffer.data(), static_cast<std::size_t>(count));
    }
    return text;
  }
  UniqueFd reader;
  UniqueFd writer;
};

class QueuedLogServiceTest : public ::testing::Test {
 protected:
  QueuedLogService& make(std::unique_ptr<LogSink> sink) {
    service_ = std::make_unique<QueuedLogService>(LogLevel::kDebug, std::move(sink), statistics_);
    category_ = &service_->createCategory("com.tarno.halvox", "hvrs");
    return *service_;
  }
  MemoryLogSink& makeWithMemory() {
    auto sink = std::make_unique<MemoryLogSink>();
    MemoryLogSink& memory = *sink;
    make(std::move(sink));
    return memory;
  }
  // What the service writes to a pipe for one line.
  std::string writtenText(LogLevel level, std::string_view text) {
    Pipe pipe;
    make(makeTextLogSink(pipe.writer.get()));
    category_->write(level, text);
    service_->stop();
    return pipe.readAll();
  }
  std::uint64_t count(const char* name) { return statistics_.counter("log", name).value(); }

  CounterStatisticsService statistics_;
  std::unique_ptr<QueuedLogService> service_;
  LogCategory* category_ = nullptr;
};

TEST_F(QueuedLogServiceTest, LineHasTimeLevelNamesAndText) {
  EXPECT_THAT(writtenText(LogLevel::kError, "it broke"),
              MatchesRegex("[0-9]{4}-[0-9]{2}-[0-9]{2}T[0-9]{2}:[0-9]{2}:[0-9]{2}\\.[0-9]{3}"
                           "[+-][0-9]{2}:[0-9]{2} error \\[com\\.tarno\\.halvox:hvrs\\] it broke"
                           "\n"));
}

TEST_F(QueuedLogServiceTest, KeepsLinesInMemoryAtALevelOfTheirOwn) {
  auto sink = std::make_unique<MemoryLogSink>();
  MemoryLogSink& written = *sink;
  QueuedLogService service({LogLevel::kError, LogLevel::kInfo}, std::move(sink), statistics_);
  LogCategory& category = service.createCategory("com.tarno.halvox", "hvrs");
  for (const auto& [level, text] :
       {std::pair(LogLevel::kDebug, "too little"), std::pair(LogLevel::kInfo, "kept"),
        std::pair(LogLevel::kError, "kept and written")}) {
    if (category.isEnabled(level)) category.write(level, text);
  }
  service.stop();

  EXPECT_FALSE(category.isEnabled(LogLevel::kDebug));
  EXPECT_EQ(written.lines(), std::vector<std::string>{"kept and written"});
  EXPECT_EQ(service.keptLines().lines, 2U);
  EXPECT_THAT(service.keptLines().text, HasSubstr(" info [com.tarno.halvox:hvrs] kept\n"));
  EXPECT_EQ(count("received"), 1U);
}

TEST_F(QueuedLogServiceTest, LevelsHaveTheirOwnWords) {
  EXPECT_THAT(writtenText(LogLevel::kDebug, "x"), HasSubstr(" debug ["));
  EXPECT_THAT(writtenText(LogLevel::kInfo, "x"), HasSubstr(" info ["));
  EXPECT_THAT(writtenText(LogLevel::kDefault, "x"), HasSubstr(" default ["));
}

TEST_F(QueuedLogServiceTest, OneLineStaysOneLineWhateverItHolds) {
  EXPECT_THAT(writtenText(LogLevel::kInfo, "a\nb\x1B[2J\xFF"), EndsWith("] a\\nb\\x1b[2J\\xff\n"));
}

TEST_F(QueuedLogServiceTest, VeryLongLineIsCutAndSaysByHowMuch) {
  const std::string line = writtenText(LogLevel::kInfo, std::string(10'000, 'x'));

  EXPECT_THAT(line, EndsWith("] " + std::string(kLongestLogLine, 'x') + "… (1808 bytes more)\n"));
}

TEST_F(QueuedLogServiceTest, EscapingDoesNotMakeALineLongerThanTheLimit) {
  const std::string line = writtenText(LogLevel::kInfo, std::string(10'000, '\n'));

  EXPECT_THAT(line, EndsWith("\\n\\n… (5904 bytes more)\n"));
}

TEST_F(QueuedLogServiceTest, StuckReaderHoldsUpNobody) {
  MemoryLogSink& sink = makeWithMemory();
  sink.hold();
  category_->write(LogLevel::kInfo, "first");
  sink.waitUntilWriting();

  const std::string line(1000, 'x');
  for (int number = 0; number < 5000; ++number) category_->write(LogLevel::kInfo, line);
  EXPECT_GT(count("dropped: reader too slow"), 3000U);
  sink.release();
  service_->stop();

  EXPECT_EQ(count("received"), 5001U);
  EXPECT_EQ(count("received"), count("delivered") + count("dropped: reader too slow"));
}

TEST_F(QueuedLogServiceTest, ErrorsFindRoomWhenOtherLinesDoNot) {
  MemoryLogSink& sink = makeWithMemory();
  sink.hold();
  category_->write(LogLevel::kInfo, "first");
  sink.waitUntilWriting();
  const std::string line(1000, 'x');
  while (count("dropped: reader too slow") == 0) category_->write(LogLevel::kInfo, line);

  category_->write(LogLevel::kError, "it broke");
  sink.release();
  service_->stop();

  EXPECT_EQ(count("dropped: reader too slow"), 1U);
  EXPECT_THAT(sink.lines(), ::testing::Contains("it broke"));
}

TEST_F(QueuedLogServiceTest, LossIsLoggedOnceThereIsRoom) {
  MemoryLogSink& sink = makeWithMemory();
  sink.hold();
  category_->write(LogLevel::kInfo, "first");
  sink.waitUntilWriting();
  const std::string line(1000, 'x');
  while (count("dropped: reader too slow") < 3) category_->write(LogLevel::kInfo, line);
  sink.release();
  service_->stop();

  EXPECT_THAT(sink.lines(), ::testing::Contains(HasSubstr(" lines were dropped")).Times(1));
}

TEST_F(QueuedLogServiceTest, StopIsBoundedWhenThePipeIsNeverRead) {
  Pipe pipe;
  make(makeTextLogSink(pipe.writer.get()));
  for (int number = 0; number < 500; ++number) {
    category_->write(LogLevel::kInfo, std::string(1000, 'x'));
  }

  const auto start = std::chrono::steady_clock::now();
  service_->stop();

  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
  EXPECT_GT(count("dropped: not taken by the reader"), 100U);
  EXPECT_EQ(count("received"), count("delivered") + count("dropped: not taken by the reader"));
}

TEST_F(QueuedLogServiceTest, ReaderThatWentAwayDoesNotEndTheProcess) {
  Pipe pipe;
  pipe.reader.reset();
  make(makeTextLogSink(pipe.writer.get()));

  category_->write(LogLevel::kInfo, "x");
  service_->stop();

  EXPECT_EQ(count("dropped: not taken by the reader"), 1U);
}

TEST_F(QueuedLogServiceTest, LinesAfterTheStopAreDroppedAndCounted) {
  makeWithMemory();
  service_->stop();

  category_->write(LogLevel::kError, "late");

  EXPECT_EQ(count("dropped: reader too slow"), 1U);
}

TEST_F(QueuedLogServiceTest, JournalGetsFields) {
  std::vector<std::string> fields;
  make(makeJournalLogSink([&fields](const iovec* vectors, int size) {
    for (int index = 0; index < size; ++index) {
      fields.emplace_back(static_cast<const char*>(vectors[index].iov_base),
                          vectors[index].iov_len);
    }
    return 0;
  }));

  category_->write(LogLevel::kDefault, "new\nconnection");
  service_->stop();

  EXPECT_EQ(fields, (std::vector<std::string>{"MESSAGE=new\\nconnection", "PRIORITY=5",
                                              "HALVOX_SUBSYSTEM=com.tarno.halvox",
                                              "HALVOX_CATEGORY=hvrs"}));
  EXPECT_EQ(count("delivered"), 1U);
}

TEST_F(QueuedLogServiceTest, JournalGetsTheIdentifierOfALineThatItsCatalogExplains) {
  std::vector<std::string> fields;
  make(makeJournalLogSink([&fields](const iovec* vectors, int size) {
    fields.emplace_back(static_cast<const char*>(vectors[size - 1].iov_base),
                        vectors[size - 1].iov_len);
    return 0;
  }));

  category_->write(LogLevel::kError, "                 BusConnection:180   lost the bus: closed");
  service_->stop();

  ASSERT_EQ(fields.size(), 1U);
  EXPECT_EQ(fields[0].substr(0, 11), "MESSAGE_ID=");
  EXPECT_EQ(fields[0].size(), 11U + 32U);
}

TEST_F(QueuedLogServiceTest, LineThatTheJournalRefusesCountsAsDropped) {
  make(makeJournalLogSink([](const iovec*, int) { return -111; }));

  category_->write(LogLevel::kDefault, "x");
  service_->stop();

  EXPECT_EQ(count("dropped: not taken by the reader"), 1U);
}

class JournalStreamTest : public ::testing::Test {
 protected:
  void TearDown() override { ::unsetenv("JOURNAL_STREAM"); }
  bool isJournal(const std::string& stream) {
    ::setenv("JOURNAL_STREAM", stream.c_str(), 1);
    return isJournalStream(pipe_.writer.get());
  }
  Pipe pipe_;
};

TEST_F(JournalStreamTest, IsRecognisedByDeviceAndInode) {
  struct stat status {};
  ASSERT_EQ(::fstat(pipe_.writer.get(), &status), 0);
  const std::string own = std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);

  EXPECT_TRUE(isJournal(own));
  EXPECT_FALSE(isJournal(own + "1"));
  EXPECT_FALSE(isJournal(own + " "));
  EXPECT_FALSE(isJournal("1:" + std::to_string(status.st_ino)));
}

TEST_F(JournalStreamTest, NonsenseIsNoJournal) {
  EXPECT_FALSE(isJournalStream(pipe_.writer.get()));
  EXPECT_FALSE(isJournal(""));
  EXPECT_FALSE(isJournal("1"));
  EXPECT_FALSE(isJournal("a:b"));
}

}  // namespace
}  // namespace halvox::platform::linux_
