#include "zu/zubroker.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <climits>
#include <cstdlib>
#include <mutex>
#include <optional>
#include <ostream>
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

// Sets KO_DEADLOCK_TIMEOUT for the life of the guard and has the broker read it again;
// the old value comes back afterwards.
class DeadlockTimeoutEnv {
 public:
  explicit DeadlockTimeoutEnv(const char* value) {
    if (const char* old = std::getenv("KO_DEADLOCK_TIMEOUT"))
      fOld = old;
    if (value)
      ::setenv("KO_DEADLOCK_TIMEOUT", value, 1);
    else
      ::unsetenv("KO_DEADLOCK_TIMEOUT");
    ZU::ZUBroker::resetDeadlockTimeoutForTesting();
  }
  ~DeadlockTimeoutEnv() {
    if (fOld)
      ::setenv("KO_DEADLOCK_TIMEOUT", fOld->c_str(), 1);
    else
      ::unsetenv("KO_DEADLOCK_TIMEOUT");
    ZU::ZUBroker::resetDeadlockTimeoutForTesting();
  }
  DeadlockTimeoutEnv(const DeadlockTimeoutEnv&) = delete;
  DeadlockTimeoutEnv& operator=(const DeadlockTimeoutEnv&) = delete;

 private:
  std::optional<std::string> fOld;
};

TEST(BrokerTest, RegistersAndFindsAModule) {
  zutest::Process process;
  auto greeter = std::make_shared<Greeter>(process.broker, "Greeter");
  process.broker->registerModule(greeter);
  EXPECT_EQ(process.broker->getModuleByName("Greeter"), greeter);
  EXPECT_THAT(process.session->services(), ElementsAre("Greeter"));
  const ko::AnyObject object = process.broker->service("Greeter");
  ASSERT_NE(object, nullptr);
  EXPECT_EQ(object->dynamicObject(), greeter);
  EXPECT_EQ(greeter->getParentBroker(), process.broker);
}

TEST(BrokerTest, RefusesANameInUseAndReportsOtherFailures) {
  zutest::Process process;
  process.broker->registerModule(std::make_shared<Greeter>(process.broker, "Greeter"));
  try {
    process.broker->registerModule(std::make_shared<Greeter>(process.broker, "Greeter"));
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName(), "ZUBroker");
    EXPECT_EQ(e.methodName(), "registerModule");
    EXPECT_EQ(e.description(), "module 'Greeter'already exists");
  }
  EXPECT_EQ(zutest::errorOf([&] {
              process.broker->registerModule(std::make_shared<Greeter>(process.broker, ""));
            }),
            "Can't register module ''A service name must not be empty");
}

TEST(BrokerTest, UnregisteringReleasesTheModule) {
  zutest::Process process;
  std::weak_ptr<Greeter> watch;
  {
    auto greeter = ZU::ZUModule::createModule<Greeter>(process.broker, "Greeter");
    watch = greeter;
  }
  ASSERT_FALSE(watch.expired());  // the broker holds it while it is registered
  EXPECT_TRUE(process.broker->unregisterModule("Greeter"));
  EXPECT_TRUE(watch.expired());
  EXPECT_TRUE(process.session->services().empty());
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

TEST(BrokerTest, AFailedUnregistrationIsLogged) {
  zutest::Process process;
  ko::log::ScopedCapture cap;
  EXPECT_FALSE(process.broker->unregisterModule("Nobody"));
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "Cannot unregister module Nobody : No service is registered as "
                            "'Nobody'"));
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "ZUBroker::unregisterModule can't unregister module: Nobody"));
}

TEST(BrokerTest, AMissingServiceIsAnEmptyObjectAfterBothLookups) {
  zutest::Process process;
  ko::log::ScopedCapture cap;
  EXPECT_EQ(process.broker->service("Nobody"), nullptr);
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "Future exception while checking local service: Cannot find service "
                            "'Nobody'"));
  EXPECT_TRUE(cap->contains("ZUBroker", ko::log::Error,
                            "Future exception while checking remote service: Cannot find "
                            "service 'Nobody'"));
}

struct TimeoutCase {
  const char* text;
  int milliseconds;
};

void PrintTo(const TimeoutCase& c, std::ostream* os) {
  *os << '"' << c.text << '"';
}

class DeadlockTimeoutParseTest : public ::testing::TestWithParam<TimeoutCase> {};

TEST_P(DeadlockTimeoutParseTest, ReadsTheBaseFromThePrefix) {
  EXPECT_EQ(ZU::ZUBroker::parseDeadlockTimeout(GetParam().text), GetParam().milliseconds);
}

INSTANTIATE_TEST_SUITE_P(Values, DeadlockTimeoutParseTest,
                         ::testing::Values(TimeoutCase{"0x1F4", 500}, TimeoutCase{"0X1f4", 500},
                                           TimeoutCase{"500", 500}, TimeoutCase{"0764", 500},
                                           TimeoutCase{"0", 0}, TimeoutCase{"", 30000},
                                           TimeoutCase{"soon", 30000},
                                           TimeoutCase{"99999999999", INT_MAX}));

TEST(DeadlockTimeoutTest, IsReadOncePerProcess) {
  {
    DeadlockTimeoutEnv env(nullptr);
    EXPECT_EQ(ZU::ZUBroker::deadlockTimeout(), 30000);
  }
  DeadlockTimeoutEnv env("0x1F4");
  EXPECT_EQ(ZU::ZUBroker::deadlockTimeout(), 500);
  ::setenv("KO_DEADLOCK_TIMEOUT", "1000", 1);
  EXPECT_EQ(ZU::ZUBroker::deadlockTimeout(), 500);
}

// A lookup that never answers: the broker gives up after the time-out in each scope and
// still says "30sec".
TEST(DeadlockTimeoutTest, ALookupThatNeverAnswersGivesUpInEachScope) {
  DeadlockTimeoutEnv env("0x1F4");
  zutest::Process process;
  ko::Promise<ko::AnyObject> never;
  std::mutex mutex;
  std::vector<std::string> scopes;
  process.session->setLookupHook(
      [&](const std::string&,
          const std::string& scope) -> std::optional<ko::Future<ko::AnyObject>> {
        std::lock_guard lock(mutex);
        scopes.push_back(scope);
        return never.future();
      });

  ko::log::ScopedCapture cap;
  EXPECT_EQ(process.broker->service("Ghost"), nullptr);
  EXPECT_THAT(scopes, ElementsAre("local", ""));
  EXPECT_TRUE(
      cap->contains("ZUBroker", ko::log::Error, "session.service(Ghost) timeout after 30sec."));
  EXPECT_TRUE(
      cap->contains("ZUBroker", ko::log::Error, "session.service(Ghost) timed out after 30sec."));
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

TEST(BrokerManagerTest, KeepsEachBrokerOnce) {
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
}

// A broker carries its manager: the manager must not keep its brokers alive in turn.
TEST(BrokerManagerTest, ABrokerThatIsGoneLeavesTheSet) {
  auto manager = std::make_shared<ZU::ZUBrokerManager>();
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>(), "gone", manager);
  std::weak_ptr<ZU::ZUBroker> watch = broker;
  manager->addBroker(broker);
  broker.reset();
  EXPECT_TRUE(watch.expired());
  EXPECT_EQ(manager->getBroker(), nullptr);
  EXPECT_TRUE(manager->getBrokers().empty());
}

}  // namespace
