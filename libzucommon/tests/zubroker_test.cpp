#include "zu/zubroker.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <climits>
#include <cstdlib>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "ko/future.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "zu/zumodule.h"
#include "zutest_modules.h"

namespace {

using ::testing::ElementsAre;
using zutest::Greeter;

// Sets KO_DEADLOCK_TIMEOUT (or unsets it) for the life of the guard and has the broker read
// it again; the old value comes back afterwards.
class DeadlockTimeoutEnv {
 public:
  explicit DeadlockTimeoutEnv(const char* value) {
    if (const char* old = std::getenv("KO_DEADLOCK_TIMEOUT"))
      fOld = old;
    set(value);
  }
  ~DeadlockTimeoutEnv() { set(fOld ? fOld->c_str() : nullptr); }

 private:
  static void set(const char* value) {
    value ? ::setenv("KO_DEADLOCK_TIMEOUT", value, 1) : ::unsetenv("KO_DEADLOCK_TIMEOUT");
    ZU::ZUBroker::resetDeadlockTimeoutForTesting();
  }
  std::optional<std::string> fOld;
};

TEST(BrokerTest, RegistersFindsAndUnregistersAModule) {
  zutest::Process process;
  std::weak_ptr<Greeter> watch;
  {
    auto greeter = ZU::ZUModule::createModule<Greeter>(process.broker, "Greeter");
    watch = greeter;
    EXPECT_EQ(process.broker->getModuleByName("Greeter"), greeter);
    EXPECT_THAT(process.session->services(), ElementsAre("Greeter"));
    const ko::AnyObject object = process.broker->service("Greeter");
    ASSERT_NE(object, nullptr);
    EXPECT_EQ(object->dynamicObject(), greeter);
    EXPECT_EQ(greeter->getParentBroker(), process.broker);
  }
  EXPECT_EQ(ko::test::errorOf([&] {
              process.broker->registerModule(std::make_shared<Greeter>(process.broker, "Greeter"));
            }),
            "\tZUBroker::registerModule\n\tmodule 'Greeter'already exists");
  EXPECT_EQ(zutest::errorOf([&] {
              process.broker->registerModule(std::make_shared<Greeter>(process.broker, ""));
            }),
            "Can't register module ''A service name must not be empty");
  ASSERT_FALSE(watch.expired());  // the broker holds it while it is registered
  EXPECT_TRUE(process.broker->unregisterModule("Greeter"));
  EXPECT_TRUE(watch.expired());
  EXPECT_TRUE(process.session->services().empty());

  ko::log::ScopedCapture cap;
  EXPECT_FALSE(process.broker->unregisterModule("Greeter"));
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "Cannot unregister module Greeter : No service is registered as "
                            "'Greeter'"));
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "ZUBroker::unregisterModule can't unregister module: Greeter"));
}

// The session announces registrations to its subscribers; one that asks the broker (here
// from another thread) is answered while the announcement runs.
TEST(BrokerTest, TheSessionsSubscribersMayUseTheBroker) {
  zutest::Process process;
  std::vector<std::thread> askers;  // joined once the broker has returned
  std::atomic<int> answers{0};
  const auto askBroker = [&](const std::string& name) {
    auto answered = std::make_shared<zutest::Gate>();
    askers.emplace_back([&process, answered, name] {
      (void)process.broker->getModuleByName(name);
      answered->open();
    });
    if (answered->wait())
      ++answers;
  };
  process.session->serviceRegistered.connect(
      [&](unsigned, const std::string& name) { askBroker(name); });
  process.session->serviceUnregistered.connect(
      [&](unsigned, const std::string& name) { askBroker(name); });
  ZU::ZUModule::createModule<Greeter>(process.broker, "Greeter");
  EXPECT_TRUE(process.broker->unregisterModule("Greeter"));
  for (auto& t : askers)
    t.join();
  EXPECT_EQ(answers, 2);
  EXPECT_TRUE(process.session->services().empty());
}

TEST(DeadlockTimeoutTest, ReadsTheBaseFromThePrefix) {
  const std::pair<const char*, int> cases[] = {
      {"0x1F4", 500}, {"0X1f4", 500}, {"500", 500},    {"0764", 500},
      {"0", 0},       {"", 30000},    {"soon", 30000}, {"99999999999", INT_MAX}};
  for (const auto& [text, milliseconds] : cases)
    EXPECT_EQ(ZU::ZUBroker::parseDeadlockTimeout(text), milliseconds) << text;
  DeadlockTimeoutEnv env(nullptr);
  EXPECT_EQ(ZU::ZUBroker::deadlockTimeout(), 30000);
}

// A lookup that never answers: the broker gives up after the time-out in each scope and
// still says "30sec". The variable is read once per process.
TEST(DeadlockTimeoutTest, ALookupThatNeverAnswersGivesUpInEachScope) {
  DeadlockTimeoutEnv env("0x1F4");
  zutest::Process process;
  ko::Promise<ko::AnyObject> never;
  ko::test::Recorded<std::string> scopes;
  process.session->setLookupHook(
      [&](const std::string&,
          const std::string& scope) -> std::optional<ko::Future<ko::AnyObject>> {
        scopes.add(scope);
        return never.future();
      });

  ko::log::ScopedCapture cap;
  EXPECT_EQ(process.broker->service("Ghost"), nullptr);
  EXPECT_THAT(scopes.all(), ElementsAre("local", ""));
  EXPECT_TRUE(
      cap->contains("ZUBroker", ko::log::Error, "session.service(Ghost) timeout after 30sec."));
  EXPECT_TRUE(
      cap->contains("ZUBroker", ko::log::Error, "session.service(Ghost) timed out after 30sec."));
  ::setenv("KO_DEADLOCK_TIMEOUT", "1000", 1);
  EXPECT_EQ(ZU::ZUBroker::deadlockTimeout(), 500);
}

// A register and an unregister of one name racing each other leave the broker and the
// session in step: the module is in both or in neither.
TEST(BrokerTest, RegisterAndUnregisterOfOneNameRacingEndInStep) {
  zutest::Process process;
  ko::log::ScopedCapture cap;  // the unregisters that come first are logged
  for (int round = 0; round < 2000; ++round) {
    auto module = std::make_shared<Greeter>(process.broker, "Racer");
    std::atomic<int> ready{0};
    auto together = [&] {
      ready.fetch_add(1);
      while (ready.load() < 2)
        std::this_thread::yield();
    };
    std::thread withdrawer([&] {
      together();
      process.broker->unregisterModule("Racer");
    });
    together();
    process.broker->registerModule(module);
    withdrawer.join();
    const auto names = process.session->services();
    const bool inSession = std::find(names.begin(), names.end(), "Racer") != names.end();
    const bool inBroker = process.broker->getModuleByName("Racer") != nullptr;
    ASSERT_EQ(inSession, inBroker) << "round " << round;
    if (inBroker) {
      ASSERT_TRUE(process.broker->unregisterModule("Racer"));
    }
  }
}

// A broker carries its manager: the manager holds its brokers weakly.
TEST(BrokerManagerTest, KeepsEachBrokerOnceAndLetsThemGo) {
  auto manager = std::make_shared<ZU::ZUBrokerManager>();
  auto session = std::make_shared<ko::Session>();
  auto first = ZU::ZUBroker::create(session, "first", manager);
  auto second = ZU::ZUBroker::create(session, "second", manager);
  manager->addBroker(first);
  manager->addBroker(second);
  manager->addBroker(first);
  EXPECT_EQ(manager->getBrokers().size(), 2u);
  EXPECT_EQ(manager->getBroker(), first);
  EXPECT_EQ(manager->getBrokerByName("second"), second);
  EXPECT_EQ(first->getBrokerManager(), manager);

  ko::log::ScopedCapture cap;
  manager->removeBroker(first);
  manager->removeBroker(first);
  EXPECT_EQ(manager->getBroker(), second);
  EXPECT_TRUE(cap->contains("ZUBroker.manager", ko::log::Warning, "Broker first is not managed"));
  std::weak_ptr<ZU::ZUBroker> watch = second;
  second.reset();
  EXPECT_TRUE(watch.expired());
  EXPECT_EQ(manager->getBroker(), nullptr);
  EXPECT_TRUE(manager->getBrokers().empty());
}

}  // namespace
