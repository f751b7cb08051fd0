#include "platform/linux/settings/InotifyNotifyService.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include "platform/linux/settings/SettingsFixture.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kName = "org.example.changed";
constexpr const char* kDomain = "org.example";
// Posting this name shows that all earlier changes have been handled.
constexpr const char* kSentinel = "sentinel";

class InotifyNotifyServiceTest : public SettingsFixture {
 protected:
  ~InotifyNotifyServiceTest() override { service_.stop(); }

  NotifyStatus listen(const std::string& name) {
    NotifyToken token = 0;
    return service_.notify_register_dispatch(name, token, queue_,
                                             [this](NotifyToken fired) { ++posts_[fired]; });
  }
  int posts(NotifyToken token) {
    platform_.dispatch.runUntilIdle();
    return posts_[token];
  }
  bool waitForPosts(NotifyToken token, int count) {
    return eventually([&] { return posts(token) >= count; });
  }
  // Waits until all earlier changes have been handled.
  void waitUntilSettled() {
    const int before = posts(sentinel_);
    write(notify() / kSentinel, "");
    ASSERT_TRUE(waitForPosts(sentinel_, before + 1));
  }
  // Registers the sentinel last, so that other names of the same post come before it.
  void begin() {
    ASSERT_EQ(service_.notify_register_dispatch(kName, name_, queue_,
                                                [this](NotifyToken fired) { ++posts_[fired]; }),
              0U);
    ASSERT_EQ(service_.notify_register_dispatch(kSentinel, sentinel_, queue_,
                                                [this](NotifyToken fired) { ++posts_[fired]; }),
              0U);
    waitUntilSettled();
  }
  // Returns the number of posts that a change causes.
  int postsOf(const std::function<void()>& change) {
    const int before = posts(name_);
    change();
    waitUntilSettled();
    return posts(name_) - before;
  }

  std::shared_ptr<DispatchQueue> queue_ = platform_.dispatch.createSerialQueue(
      "test", QualityOfService::kUtility, QueueThreading::kShared);
  std::map<NotifyToken, int> posts_;
  NotifyToken sentinel_ = 0;
  NotifyToken name_ = 0;
  PreferenceReader reader_{preferences(), platform_.log};
  InotifyNotifyService service_{notify(), reader_, platform_.log, platform_.statistics};
};

TEST_F(InotifyNotifyServiceTest, EveryRegistrationHasATokenOfItsOwn) {
  begin();

  EXPECT_NE(sentinel_, 0);
  EXPECT_NE(name_, 0);
  EXPECT_NE(name_, sentinel_);
}

TEST_F(InotifyNotifyServiceTest, NamesThatCannotBeFilesAreRefused) {
  for (const std::string& name : {std::string(), std::string(".."), std::string("a/b"),
                                  std::string("a\0b", 3), std::string(1000, 'a')}) {
    NotifyToken token = 77;
    EXPECT_EQ(service_.notify_register_dispatch(name, token, queue_, [](NotifyToken) {}),
              kNotifyInvalidName);
    EXPECT_EQ(token, 77);
  }
  EXPECT_EQ(linesWith("cannot register for the notification"), 5U);
}

TEST_F(InotifyNotifyServiceTest, AFileThatIsMadeTouchedOrWrittenPostsItsName) {
  begin();

  EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
  EXPECT_EQ(postsOf([this] { ::utimensat(AT_FDCWD, (notify() / kName).c_str(), nullptr, 0); }), 1);
  EXPECT_EQ(postsOf([this] { write(notify() / kName, "anything"); }), 1);
}

TEST_F(InotifyNotifyServiceTest, AFileThatIsMovedIntoTheDirectoryPostsItsName) {
  begin();
  write(scratch_ / "elsewhere", "");

  EXPECT_EQ(postsOf([this] { std::filesystem::rename(scratch_ / "elsewhere", notify() / kName); }),
            1);
}

TEST_F(InotifyNotifyServiceTest, AFileThatIsMadeAndDeletedAtOncePostsItsName) {
  begin();

  EXPECT_EQ(postsOf([this] {
              write(notify() / kName, "");
              std::filesystem::remove(notify() / kName);
            }),
            1);
  write(notify() / kName, "");
  waitUntilSettled();
  EXPECT_EQ(postsOf([this] { std::filesystem::remove(notify() / kName); }), 0);
}

TEST_F(InotifyNotifyServiceTest, OtherFilesPostNothing) {
  begin();

  EXPECT_EQ(postsOf([this] {
              write(notify() / (std::string(kName) + "x"), "");
              write(preferences() / "mobile" / "org.example2.toml", "a = 1");
              write(preferences() / "root" / "org.example.toml", "a = 1");
              write(preferences() / "mobile" / "org.example.toml~", "a = 1");
            }),
            0);
}

TEST_F(InotifyNotifyServiceTest, APostCallsEveryHandlerOfThatNameWithItsToken) {
  begin();
  NotifyToken second = 0;
  ASSERT_EQ(service_.notify_register_dispatch(kName, second, queue_,
                                              [this](NotifyToken fired) { ++posts_[fired]; }),
            0U);

  EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
  EXPECT_TRUE(waitForPosts(second, 1));
  EXPECT_EQ(posts(second), 1);
  EXPECT_NE(second, name_);
}

TEST_F(InotifyNotifyServiceTest, WhatIsThereAtTheRegistrationPostsNothing) {
  write(notify() / kName, "");
  write(domainFile(kDomain), "a = 1");

  begin();

  EXPECT_EQ(posts(name_), 0);
}

TEST_F(InotifyNotifyServiceTest, AChangedPreferenceFilePostsTheNamesOfItsDomain) {
  begin();
  const auto domainsOfName = {"org", "org.example", "org.example.changed"};
  for (const std::string domain : domainsOfName) {
    EXPECT_EQ(postsOf([&] { write(domainFile(domain), "a = 1"); }), 1) << domain;
  }
}

TEST_F(InotifyNotifyServiceTest, EveryWayOfSavingIsOnePost) {
  begin();
  const auto file = domainFile(kDomain);
  const auto other = preferences() / "mobile" / ".org.example.toml.swp";

  EXPECT_EQ(postsOf([&] { write(file, "a = 1"); }), 1) << "made";
  EXPECT_EQ(postsOf([&] { write(file, "a = 2"); }), 1) << "truncated and written";
  EXPECT_EQ(postsOf([&] {
              write(file, "");
              write(file, "a = 3");
            }),
            1)
      << "truncated, then written";
  EXPECT_EQ(postsOf([&] {
              write(other, "a = 4");
              std::filesystem::rename(other, file);
            }),
            1)
      << "renamed over";
  EXPECT_EQ(postsOf([&] {
              std::filesystem::rename(file, other);
              write(file, "a = 5");
              std::filesystem::remove(other);
            }),
            1)
      << "moved away as a backup and written anew";
  EXPECT_EQ(postsOf([&] { std::filesystem::remove(file); }), 1) << "removed";
}

TEST_F(InotifyNotifyServiceTest, ASaveThatChangesNoValuePostsNothing) {
  begin();
  write(domainFile(kDomain), "a = 1\n");
  ASSERT_TRUE(waitForPosts(name_, 1));

  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = 1\n"); }), 0);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "# note\na  =  1\n"); }), 0);
}

TEST_F(InotifyNotifyServiceTest, ABrokenFilePostsNothingUntilItIsFixedWithOtherValues) {
  begin();
  write(domainFile(kDomain), "a = 1");
  ASSERT_TRUE(waitForPosts(name_, 1));

  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = "); }), 0);
  EXPECT_EQ(linesWith("org.example.toml:1:"), 1U);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = 1"); }), 0);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = "); }), 0);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = 2"); }), 1);
}

TEST_F(InotifyNotifyServiceTest, APipeInThePlaceOfAFileHoldsNothingUp) {
  begin();

  EXPECT_EQ(postsOf([this] {
              std::filesystem::create_directories(preferences() / "mobile");
              ASSERT_EQ(::mkfifo(domainFile(kDomain).c_str(), 0600), 0);
            }),
            0);
  EXPECT_EQ(linesWith("expected a regular file"), 1U);
}

TEST_F(InotifyNotifyServiceTest, AFileAndAPreferenceTogetherAreOnePost) {
  begin();

  EXPECT_EQ(postsOf([this] {
              write(domainFile(kDomain), "a = 1");
              write(notify() / kName, "");
            }),
            1);
}

TEST_F(InotifyNotifyServiceTest, ADirectoryThatIsDeletedAndMadeAgainWorksAgain) {
  begin();
  for (int turn = 0; turn < 3; ++turn) {
    EXPECT_EQ(postsOf([this] {
                std::filesystem::remove_all(notify());
                write(notify() / kName, "");
              }),
              1);
    EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
  }
}

TEST_F(InotifyNotifyServiceTest, ADirectoryThatIsMovedAwayIsWatchedNoMore) {
  begin();
  std::filesystem::rename(notify(), scratch_ / "old");
  waitUntilSettled();  // in the new directory

  EXPECT_EQ(postsOf([this] { write(scratch_ / "old" / kName, ""); }), 0);
  EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
}

TEST_F(InotifyNotifyServiceTest, AllDirectoriesOnTheWayMayGoAndComeBack) {
  begin();
  write(domainFile(kDomain), "a = 1");
  ASSERT_TRUE(waitForPosts(name_, 1));

  std::filesystem::rename(scratch_, scratch_.native() + ".away");
  std::filesystem::remove_all(scratch_.native() + ".away");
  write(domainFile(kDomain), "a = 2");
  ASSERT_TRUE(waitForPosts(name_, 2));

  EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
}

TEST_F(InotifyNotifyServiceTest, TheTargetOfALinkIsWatched) {
  const auto file = domainFile(kDomain);
  const auto real = scratch_ / "elsewhere" / "settings";
  write(real, "a = 1");
  std::filesystem::create_directories(file.parent_path());
  std::filesystem::create_symlink(real, file);
  begin();

  EXPECT_EQ(postsOf([&] { write(real, "a = 2"); }), 1) << "written";
  EXPECT_EQ(postsOf([&] {
              write(scratch_ / "elsewhere" / "new", "a = 3");
              std::filesystem::rename(scratch_ / "elsewhere" / "new", real);
            }),
            1)
      << "renamed over";
  EXPECT_EQ(postsOf([&] { write(scratch_ / "elsewhere" / "other", "a = 4"); }), 0);
  EXPECT_EQ(postsOf([&] { std::filesystem::remove_all(scratch_ / "elsewhere"); }), 1) << "removed";
  EXPECT_EQ(postsOf([&] { write(real, "a = 5"); }), 1) << "made again";
}

TEST_F(InotifyNotifyServiceTest, AFileThatBecomesALinkIsFollowed) {
  const auto file = domainFile(kDomain);
  write(file, "a = 1");
  begin();
  write(scratch_ / "one", "a = 1");
  write(scratch_ / "two", "a = 2");
  const auto pointTo = [&](const char* name) {
    std::filesystem::create_symlink(scratch_ / name, scratch_ / "link");
    std::filesystem::rename(scratch_ / "link", file);
  };

  EXPECT_EQ(postsOf([&] { pointTo("one"); }), 0) << "of the same values";
  EXPECT_EQ(postsOf([&] { write(scratch_ / "one", "a = 11"); }), 1);
  EXPECT_EQ(postsOf([&] { pointTo("two"); }), 1);
  EXPECT_EQ(postsOf([&] { write(scratch_ / "one", "a = 12"); }), 0);
  EXPECT_EQ(postsOf([&] { write(scratch_ / "two", "a = 22"); }), 1);
}

// Settings that must all change at the same moment are often kept in this way.
TEST_F(InotifyNotifyServiceTest, ALinkedDirectoryOnTheWayIsFollowed) {
  const auto directory = preferences() / "mobile";
  write(directory / "..1" / "org.example.toml", "a = 1");
  write(directory / "..2" / "org.example.toml", "a = 2");
  std::filesystem::create_directory_symlink("..1", directory / "..data");
  std::filesystem::create_symlink("..data/org.example.toml", domainFile(kDomain));
  begin();

  EXPECT_EQ(postsOf([&] {
              std::filesystem::create_directory_symlink("..2", directory / "..new");
              std::filesystem::rename(directory / "..new", directory / "..data");
            }),
            1);
  EXPECT_EQ(postsOf([&] { write(directory / "..2" / "org.example.toml", "a = 3"); }), 1);
}

TEST_F(InotifyNotifyServiceTest, ADirectoryOfPreferencesThatIsALinkIsFollowed) {
  write(scratch_ / "one" / "org.example.toml", "a = 1");
  write(scratch_ / "two" / "org.example.toml", "a = 2");
  std::filesystem::create_directories(preferences());
  std::filesystem::create_directory_symlink(scratch_ / "one", preferences() / "mobile");
  begin();

  EXPECT_EQ(postsOf([&] { write(scratch_ / "one" / "org.example.toml", "a = 3"); }), 1);
  EXPECT_EQ(postsOf([&] {
              std::filesystem::create_directory_symlink(scratch_ / "two", preferences() / "new");
              std::filesystem::rename(preferences() / "new", preferences() / "mobile");
            }),
            1);
  EXPECT_EQ(postsOf([&] { write(scratch_ / "two" / "org.example.toml", "a = 4"); }), 1);
}

TEST_F(InotifyNotifyServiceTest, ADirectoryOfNamesThatIsALinkIsFollowed) {
  std::filesystem::create_directories(scratch_ / "one");
  std::filesystem::create_directories(scratch_ / "two");
  std::filesystem::remove_all(notify());
  std::filesystem::create_directory_symlink(scratch_ / "one", notify());
  begin();

  std::filesystem::create_directory_symlink(scratch_ / "two", scratch_ / "new");
  std::filesystem::rename(scratch_ / "new", notify());

  EXPECT_EQ(postsOf([&] { write(scratch_ / "two" / kName, ""); }), 1);
  EXPECT_EQ(postsOf([&] { write(scratch_ / "one" / kName, ""); }), 0);
}

TEST_F(InotifyNotifyServiceTest, NoPreferenceIsMissedInAFloodOfEvents) {
  begin();
  std::filesystem::create_directories(preferences() / "mobile");

  // Far more events than the kernel queues for a slow reader.
  for (int turn = 0; turn < 20'000; ++turn) {
    const auto other = preferences() / "mobile" / ("x" + std::to_string(turn % 7));
    ::close(::open(other.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  }
  write(domainFile(kDomain), "a = 1");

  EXPECT_TRUE(waitForPosts(name_, 1));
}

TEST_F(InotifyNotifyServiceTest, SteadyChangesAreNotPutOffForEver) {
  begin();
  int number = 0;

  EXPECT_TRUE(eventually([&] {
    write(domainFile(kDomain), "a = " + std::to_string(++number));
    return posts(name_) >= 3;
  }));
}

TEST_F(InotifyNotifyServiceTest, AfterTheStopRegistrationsFail) {
  begin();
  service_.stop();
  service_.stop();

  EXPECT_EQ(listen("another"), kNotifyFailed);
}

TEST_F(InotifyNotifyServiceTest, EverythingNoticedIsAccountedFor) {
  begin();
  EXPECT_EQ(postsOf([this] { write(notify() / kName, ""); }), 1);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = "); }), 0);
  EXPECT_EQ(postsOf([this] { write(domainFile(kDomain), "a = 1"); }), 1);
  service_.stop();

  auto counted = platform_.statistics.values("notifications");
  EXPECT_GE(counted["suppressed: preferences not readable"], 1U);
  EXPECT_EQ(counted["noticed"], counted["posted"] + counted["suppressed: nothing new"] +
                                    counted["suppressed: preferences not readable"] +
                                    counted["merged with another"]);
}

}  // namespace
}  // namespace halvox::platform::linux_
