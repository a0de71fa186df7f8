// The text register: identifiers, release, stop marks.
#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "mokuto/mkidregister.h"

namespace {

using namespace std::chrono_literals;

TEST(TextRegister, ASharedIdentifierKeepsTheLaterTextAndItsSecondReleaseIsLogged) {
  ko::log::ScopedCapture log(ko::log::Info);
  ZU::MKIDRegister texts;
  auto local = std::make_shared<ZU::MKTaskInstruction>();
  auto task = std::make_shared<ZU::MKTaskInstruction>();
  ASSERT_EQ(texts.newMKID(local, std::nullopt), 1);
  ASSERT_EQ(texts.newMKID(task, 1), 1);
  EXPECT_EQ(texts.runningTexts.at(1), task);
  {
    std::lock_guard lock(texts.textsMutex);
    texts.textsToStop.insert(1);
  }
  EXPECT_TRUE(texts.isMKIDStopped(1));
  // A waiter of the releases (the blocking stop of every text) wakes at the first one.
  bool waiting = false;  // under textsMutex, which the waiter leaves only in its wait
  auto waiter = std::async(std::launch::async, [&] {
    std::unique_lock lock(texts.textsMutex);
    waiting = true;
    texts.textsCondition.wait(lock, [&] { return texts.textsToStop.empty(); });
  });
  ASSERT_TRUE(ko::test::eventually([&] {
    std::lock_guard lock(texts.textsMutex);
    return waiting;
  }));
  texts.freeMKID(1);
  const bool woke = waiter.wait_for(10s) == std::future_status::ready;
  texts.textsCondition.notify_all();  // ends a waiter that the release left waiting
  EXPECT_TRUE(woke);
  EXPECT_FALSE(texts.isMKIDStopped(1));
  EXPECT_EQ(log->count(), 0u);
  texts.freeMKID(1);
  const auto records = log->records();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_EQ(records[0].category, "mokuto.main");
  EXPECT_EQ(records[0].level, ko::log::Error);
  EXPECT_EQ(records[0].function, "ZU::ZUMokuto::xFreeMKID");
  EXPECT_EQ(records[0].message,
            "Cannot remove the id of the current text because it doesn't exist anymore.");
}

}  // namespace
