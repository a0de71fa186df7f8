#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <stdexcept>
#include <thread>

#include "ko/dynamicobject.hpp"
#include "ko/genericobject.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::AnyObject;
using ko::AnyValue;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class Speaker {
 public:
  std::string say(const std::string& text) { return "said " + text; }
  std::string sayWith(const std::string& text, const std::string& config) {
    return "said " + text + " with " + config;
  }
  int volume() const { return volume_; }
  void setVolume(int v) { volume_ = v; }

 private:
  std::atomic<int> volume_{50};
};

// An object with overloads, members, a raw method, a failing method and a signal.
AnyObject makeCalculator(ko::DynamicObjectBuilder& b, Speaker& speaker) {
  b.setDescription("calculator");
  b.advertiseMethod(
      "add", [](int a, int c) { return a + c; }, "Adds integers.");
  b.advertiseMethod("add", [](const std::string& a, const std::string& c) { return a + c; });
  b.advertiseMethod("add", [](double a, double c) { return a + c; });
  b.advertiseMethod("say", &speaker, &Speaker::say, "Says a text.");
  b.advertiseMethod("say", &speaker, &Speaker::sayWith);
  b.advertiseMethod("volume", &speaker, &Speaker::volume);
  b.advertiseMethod("setVolume", &speaker, &Speaker::setVolume);
  b.advertiseMethod("fail", []() -> int { throw std::runtime_error("engine overheated"); });
  b.advertiseMethod("sum", "([m])", "m",
                    [](const std::vector<AnyValue>& args) {
                      int total = 0;
                      for (const auto& v : args[0].asList())
                        total += v.to<int>();
                      return AnyValue(total);
                    },
                    "Sums a list.", {{"values", "The values to add."}}, {"total", "Their sum."});
  b.advertiseSignal<int, std::string>("ticked");
  return b.object();
}

class ObjectTest : public ::testing::Test {
 protected:
  Speaker speaker_;
  ko::DynamicObjectBuilder builder_;
  AnyObject obj_ = makeCalculator(builder_, speaker_);
};

struct OverloadCase {
  const char* label;
  std::vector<AnyValue> args;
  AnyValue expected;
};

TEST_F(ObjectTest, OverloadsResolveExactThenByAcceptance) {
  const std::vector<OverloadCase> cases = {
      {"exact ints", {1, 2}, 3},
      {"exact strings", {"ab", "cd"}, "abcd"},
      {"exact doubles", {1.5, 2.0}, 3.5},
      {"float and int only fit doubles", {1.5, 2}, 3.5},
      {"dynamic string fits strings", {AnyValue::dynamic("x"), "y"}, "xy"},
  };
  for (const auto& c : cases)
    EXPECT_EQ(obj_->call(std::string_view("add"), c.args), c.expected) << c.label;
  EXPECT_EQ(obj_->call<std::string>("say", "hello"), "said hello");
  EXPECT_EQ(obj_->call<std::string>("say", "hello", "{}"), "said hello with {}");
  EXPECT_EQ(obj_->callById<std::string>(obj_->findMethod("add").at(1).id, {"k", "o"}), "ko");
  EXPECT_EQ(obj_->call<int>("sum", std::vector<AnyValue>{AnyValue::list({1, 2, 3})}), 6);
  obj_->call<void>("setVolume", 80);
  EXPECT_EQ(obj_->call<int>("volume"), 80);
}

TEST_F(ObjectTest, NoSingleMatchListsTheCandidates) {
  try {
    obj_->call<int>("add", "a", 1);
    FAIL() << "ambiguous call accepted";
  } catch (const ko::OverloadError& e) {
    EXPECT_EQ(e.method(), "add");
    EXPECT_EQ(e.argumentsSignature(), "(si)");
    EXPECT_THAT(e.candidates(), ElementsAre("add::(ii)", "add::(ss)", "add::(dd)"));
    EXPECT_THAT(e.what(), HasSubstr("add::(ss)"));
  }
  // Integers are accepted both as integers and as doubles, but the exact match wins...
  EXPECT_EQ(obj_->call<int>("add", 2, 3), 5);
  // ...while an 8-byte integer pair has no exact match and fits two overloads.
  EXPECT_THROW(obj_->call("add", std::int64_t{2}, std::int64_t{3}), ko::OverloadError);
  EXPECT_THROW(obj_->call("add", 1), ko::OverloadError);
  EXPECT_THROW(obj_->call("volume", 1), ko::OverloadError);
  EXPECT_EQ(ko::test::errorOf([&] { obj_->call("missing"); }),
            "Cannot find method 'missing' on calculator");
}

TEST_F(ObjectTest, FailuresCarryTheirText) {
  struct Case {
    const char* label;
    std::function<void()> call;
    std::string text;
  };
  const std::vector<Case> cases = {
      {"method throws", [&] { obj_->call<int>("fail"); }, "engine overheated"},
      {"argument does not convert", [&] { obj_->call("setVolume", "loud"); },
       "Cannot convert argument 1 of setVolume::(i): "},
      {"unknown id", [&] { obj_->callById(12345, {}); }, "No method with id 12345"},
      {"wrong count by id", [&] { obj_->callById(obj_->findMethod("volume")[0].id, {1}); },
       "Method volume::() takes 0 argument(s), got 1"},
      {"result does not convert", [&] { obj_->call<std::string>("add", 1, 2); },
       "Unable to convert call result to target type: from i to s"},
      {"list result does not convert", [&] { obj_->call<std::vector<int>>("say", "x"); },
       "Unable to convert call result to target type: from s to [i]"},
  };
  for (const auto& c : cases)
    EXPECT_THAT(ko::test::errorOf<ko::Error>(c.call), HasSubstr(c.text)) << c.label;
  try {
    obj_->call<std::string>("add", 1, 2);
  } catch (const ko::ResultConversionError& e) {
    EXPECT_EQ(e.sourceSignature() + e.targetSignature(), "is");
  }
  EXPECT_EQ(obj_->async<std::string>("add", 1, 2).error(10000),
            "Unable to convert call result to target type: from i to s");
}

TEST_F(ObjectTest, AsyncRunsOnTheEventLoop) {
  auto loop = std::make_shared<ko::EventLoop>("object", 2);
  builder_.dynamicObject()->setEventLoop(loop);
  auto object = builder_.dynamicObject();
  builder_.advertiseMethod("inLoop", [loop] { return loop->isInThisLoop(); });
  EXPECT_TRUE(obj_->async<bool>("inLoop").value(10000));
  EXPECT_EQ(obj_->async<int>("add", 20, 22).value(10000), 42);
  EXPECT_EQ(obj_->async<int>("fail").error(10000), "engine overheated");
  EXPECT_THAT(obj_->async("nope").error(0), HasSubstr("Cannot find method 'nope'"));
  auto queued = object->metaCall(obj_->findMethod("inLoop")[0].id, {}, ko::MetaCallType::Queued);
  EXPECT_TRUE(queued.value(10000).to<bool>());
}

TEST_F(ObjectTest, ManyThreadsCallWhileMethodsAreAdded) {
  constexpr int kThreads = 8;
  constexpr int kCalls = 2000;
  std::atomic<int> wrong{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kCalls; ++i) {
        if (obj_->call<int>("add", t, i) != t + i)
          ++wrong;
        if (obj_->call<std::string>("add", "a", "b") != "ab")
          ++wrong;
      }
    });
  }
  // Publishing goes on meanwhile: every addition publishes a new member table.
  for (int m = 0; m < 50; ++m)
    builder_.advertiseMethod("late" + std::to_string(m), [m] { return m; });
  for (auto& th : threads)
    th.join();
  EXPECT_EQ(wrong.load(), 0);
  EXPECT_EQ(obj_->call<int>("late49"), 49);
}

TEST_F(ObjectTest, DuplicatesAndMalformedSignaturesAreRefused) {
  EXPECT_THROW(builder_.advertiseMethod("add", [](int a, int c) { return a * c; }), ko::Error);
  EXPECT_THROW(builder_.advertiseSignal<int>("ticked"), ko::Error);
  EXPECT_THROW(builder_.advertiseSignal<int>("add"), ko::Error);
  EXPECT_THROW(builder_.advertiseMethod("raw", "([i", "v", [](const auto&) { return AnyValue(); }),
               ko::Error);
  EXPECT_THROW(builder_.advertiseMethod("raw", "(i)", "v", ko::MethodFunction()), ko::Error);
  // A refused member leaves the object as it was.
  EXPECT_TRUE(obj_->findMethod("raw").empty());
}

TEST_F(ObjectTest, SignalConnectedFromAnotherObject) {
  // A listener service whose method is called from the calculator's signal.
  ko::DynamicObjectBuilder listenerBuilder;
  ko::test::Recorded<std::string> heard;
  listenerBuilder.advertiseMethod(
      "onTick", [&](int n, const std::string& what) { heard.add(what + std::to_string(n)); });
  AnyObject listener = listenerBuilder.object();

  const ko::SignalLink link = obj_->connect(
      "ticked", [listener](int n, std::string what) { listener->call<void>("onTick", n, what); });
  std::vector<AnyValue> raw;
  const ko::SignalLink rawLink =
      obj_->connect("ticked", [&](const std::vector<AnyValue>& args) { raw = args; });

  obj_->post("ticked", 1, "tick");
  builder_.dynamicObject()->signal<int, std::string>("ticked")->operator()(2, "tock");
  obj_->disconnect(link);
  obj_->post("ticked", 3, "gone");
  EXPECT_THAT(heard.all(), ElementsAre("tick1", "tock2"));
  ASSERT_EQ(raw.size(), 2u);
  EXPECT_EQ(raw[0].to<int>(), 3);

  obj_->disconnect(rawLink);
  EXPECT_THROW(obj_->disconnect(rawLink), ko::Error);
  EXPECT_THROW(obj_->post("ticked", "wrong", "types"), ko::Error);
  EXPECT_THROW(obj_->post("nope"), ko::Error);
  EXPECT_THROW(obj_->connect("nope", [](int) {}), ko::Error);
}

TEST(WeakObject, CallsOnAGoneObjectFailClearly) {
  auto holder = std::make_shared<ko::DynamicObject>();
  holder->advertiseMethod("ping", [] { return true; });
  AnyObject weak = ko::GenericObject::makeWeak(holder, "ZUMokuto");
  EXPECT_TRUE(weak->isWeak());
  EXPECT_TRUE(weak->call<bool>("ping"));
  holder.reset();
  EXPECT_FALSE(weak->isValid());
  EXPECT_EQ(weak->dynamicObject(), nullptr);
  EXPECT_EQ(ko::test::errorOf<ko::Error>([&] { weak->call<bool>("ping"); }),
            "Object is gone: ZUMokuto");
  EXPECT_THROW(weak->callById(100, {}), ko::Error);
  EXPECT_THROW(weak->metaObject(), ko::Error);
  EXPECT_THROW(weak->post("x"), ko::Error);
  EXPECT_EQ(weak->async<bool>("ping").error(0), "Object is gone: ZUMokuto");
  EXPECT_EQ(weak->asyncById<bool>(100, {}).error(0), "Object is gone: ZUMokuto");
  EXPECT_THROW(ko::GenericObject::makeStrong(nullptr), ko::Error);
}

}  // namespace
