#include "ko/session.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <thread>
#include <utility>
#include <vector>

#include "ko/dynamicobject.hpp"
#include "ko/genericobject.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::AnyObject;
using ko::FutureState;
using ::testing::ElementsAre;

AnyObject makeService(const std::string& answer) {
  ko::DynamicObjectBuilder b;
  b.advertiseMethod("whoami", [answer] { return answer; });
  return b.object();
}

class SessionTest : public ::testing::Test {
 protected:
  ko::Session session_;
};

TEST_F(SessionTest, RegisteredServiceIsFoundInBothScopesAndItsNameIsTaken) {
  const unsigned id = session_.registerService("ZUMotion", makeService("first"));
  EXPECT_NE(id, 0u);
  for (const std::string scope : {"local", ""}) {
    auto found = session_.service("ZUMotion", scope);
    ASSERT_EQ(found.wait(0), FutureState::FinishedWithValue) << scope;
    EXPECT_EQ(found.value()->call<std::string>("whoami"), "first");
  }
  EXPECT_THAT(session_.services(), ElementsAre("ZUMotion"));
  EXPECT_EQ(ko::test::errorOf<ko::Error>(
                [&] { session_.registerService("ZUMotion", makeService("second")); }),
            "Service 'ZUMotion' is already registered");
  EXPECT_EQ(session_.service("ZUMotion").value()->call<std::string>("whoami"), "first");
  session_.unregisterService(id);
  EXPECT_NE(session_.registerService("ZUMotion", makeService("second")), id);

  EXPECT_EQ(session_.service("ZUTextToSpeech", "local").error(0),
            "Cannot find service 'ZUTextToSpeech'");
  EXPECT_EQ(session_.service("ZUTextToSpeech").error(0), "Cannot find service 'ZUTextToSpeech'");
  EXPECT_EQ(session_.service("x", "galaxy").error(0), "Unknown scope 'galaxy'");
  EXPECT_THROW(session_.registerService("", makeService("x")), ko::Error);
  EXPECT_THROW(session_.registerService("empty", nullptr), ko::Error);
  EXPECT_THROW(session_.unregisterService(42u), ko::Error);
  EXPECT_THROW(session_.unregisterService("nobody"), ko::Error);
}

// The announcements follow the order of the changes, even when a registration and the
// withdrawal that follows it are made by two threads at once; and a subscriber may
// register a service of its own (announced after it returns, without a deadlock).
TEST_F(SessionTest, AnnouncementsComeInTheOrderOfTheChanges) {
  ko::test::Recorded<std::pair<bool, unsigned>> announced;  // registered?, id
  session_.serviceRegistered.connect([&](unsigned id, const std::string& name) {
    announced.add({true, id});
    if (name == "first")
      session_.registerService("nested", makeService("n"));
  });
  session_.serviceUnregistered.connect([&](unsigned id, const std::string&) {
    announced.add({false, id});
  });
  session_.registerService("first", makeService("f"));
  ASSERT_EQ(session_.services().size(), 2u);

  constexpr int kRounds = 2000;
  // Each change is tried again until the other thread's change has made it possible.
  const auto roundsOf = [](const std::function<void()>& change) {
    for (int i = 0; i < kRounds; ++i) {
      while (ko::test::errorOf<ko::Error>(change) != "<none>")
        std::this_thread::yield();
    }
  };
  std::thread withdrawer(roundsOf, [&] { session_.unregisterService("svc"); });
  roundsOf([&] { session_.registerService("svc", makeService("s")); });
  withdrawer.join();
  // Of "svc", registrations and withdrawals alternate, each withdrawal of the id just
  // registered.
  const auto seen = announced.all();
  ASSERT_EQ(seen.size(), 2u + 2u * kRounds);
  for (std::size_t i = 2; i + 1 < seen.size(); i += 2) {
    ASSERT_TRUE(seen[i].first) << i;
    ASSERT_FALSE(seen[i + 1].first) << i;
    ASSERT_EQ(seen[i].second, seen[i + 1].second) << i;
  }
}

TEST_F(SessionTest, LookupHookCanHangFailOrPassThrough) {
  session_.registerService("ZURobotPosture", makeService("posture"));
  ko::Promise<AnyObject> never;
  std::vector<std::string> asked;
  session_.setLookupHook([&](const std::string& name,
                             const std::string& scope) -> std::optional<ko::Future<AnyObject>> {
    asked.push_back(name + "@" + scope);
    if (name == "hang")
      return never.future();
    if (name == "fail")
      return ko::makeFutureError<AnyObject>("network down");
    if (name == "throw")
      throw std::runtime_error("hook broke");
    return std::nullopt;
  });
  EXPECT_EQ(session_.service("hang", "local").wait(std::chrono::milliseconds(20)),
            FutureState::Timeout);
  EXPECT_EQ(session_.service("fail").error(0), "network down");
  EXPECT_EQ(session_.service("throw").error(0), "hook broke");
  EXPECT_TRUE(session_.service("ZURobotPosture", "local").hasValue(0));
  EXPECT_THAT(asked, ElementsAre("hang@local", "fail@", "throw@", "ZURobotPosture@local"));
  session_.setLookupHook(nullptr);
  EXPECT_EQ(session_.service("hang").error(0), "Cannot find service 'hang'");
}

}  // namespace
