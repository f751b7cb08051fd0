#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

constexpr int kThreads = 4;
constexpr int kRounds = 5'000;

// Runs the same work on several threads at once and waits for all of them.
template <typename Work>
void onSeveralThreads(const Work& work) {
  std::vector<std::jthread> threads;
  threads.reserve(kThreads);
  for (int number = 0; number < kThreads; ++number)
    threads.emplace_back([&work, number] { work(number); });
}

TEST(ValueConcurrencyTest, ThreadsCopyAndChangeOneDictionary) {
  Dictionary original{{"list", Array{"a text that is held on the heap"}}};
  for (int number = 0; number < 30; ++number) original.set(std::to_string(number), number);
  const Dictionary& shared = original;

  onSeveralThreads([&shared](int thread) {
    for (int round = 0; round < kRounds; ++round) {
      Dictionary copy = shared;
      if (round % 10 == 0) copy.set("thread", thread);
      const Value list = *copy.find("list");
      ASSERT_EQ(list.array()[0].string(), "a text that is held on the heap");
      ASSERT_EQ(shared.size(), 31U);
    }
  });

  EXPECT_FALSE(original.contains("thread"));
}

TEST(ValueConcurrencyTest, ThreadsAddToCopiesOfADictionaryWithRoom) {
  for (int round = 0; round < 200; ++round) {
    Dictionary original;
    original.reserve(4);
    original.set("a", 1);
    const Dictionary& shared = original;
    onSeveralThreads([&shared](int thread) {
      Dictionary copy = shared;
      copy.set("thread", thread);
      ASSERT_EQ(copy.size(), 2U);
      ASSERT_EQ(*copy.find("thread"), Value(thread));
      ASSERT_EQ(shared.size(), 1U);
    });
    ASSERT_EQ(original, (Dictionary{{"a", 1}}));
  }
}

TEST(ValueConcurrencyTest, TheLastHolderMayBeAnyThread) {
  for (int round = 0; round < 200; ++round) {
    std::vector<Value> copies(kThreads, Value(Dictionary{{"key", "a text that is on the heap"}}));
    onSeveralThreads([&copies](int thread) {
      auto& copy = copies[static_cast<std::size_t>(thread)];
      ASSERT_EQ(copy.dictionary().find("key")->string(), "a text that is on the heap");
      copy = Value();
    });
  }
}

TEST(ValueConcurrencyTest, AChangeThatNeedsNoCopySeesWhatOthersDidBefore) {
  for (int round = 0; round < 200; ++round) {
    Dictionary original{{"a", 1}};
    Dictionary copy = original;
    std::jthread other([copy = std::move(copy)]() mutable {
      ASSERT_EQ(*copy.find("a"), Value(1));
      copy = Dictionary();
    });
    original.set("a", 2);  // shared or not, depending on the other thread
    ASSERT_EQ(*original.find("a"), Value(2));
  }
}

TEST(ValueConcurrencyTest, ThreadsInternTheSameKeys) {
  std::vector<std::vector<Key>> keys(kThreads);

  onSeveralThreads([&keys](int thread) {
    for (int number = 0; number < 500; ++number) {
      keys[static_cast<std::size_t>(thread)].emplace_back("concurrent " + std::to_string(number));
    }
  });

  for (const std::vector<Key>& ofThread : keys) EXPECT_EQ(ofThread, keys.front());
}

TEST(ValueConcurrencyTest, ThreadsShareKeysThatAreNotInterned) {
  const Key key(std::string(300, 'k'));

  onSeveralThreads([&key](int /*thread*/) {
    for (int round = 0; round < kRounds; ++round) {
      const Key copy = key;  // NOLINT(performance-unnecessary-copy-initialization): tested
      ASSERT_EQ(copy.text().size(), 300U);
    }
  });
}

}  // namespace
}  // namespace halvox::platform
