// Hello: a module of a robot's own. It greets people, counts the greetings, and has the
// robot greet them aloud with a wave through the speech-animation service ZUMokuto, which
// the same zefoko serve loads beside it.
//
// Threads: its methods run in the threads of their callers, several at once; the count is
// atomic, and a call to ZUMokuto blocks only its caller.
#include <atomic>
#include <memory>
#include <string>

#include "zu/zumoduleentry.h"
#include "zu/zuproxy.h"

namespace {

class Hello : public ZU::ZUModule {
 public:
  Hello(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZU::ZUModule(broker, name) {
    setModuleDescription("Greets people, and has the robot greet them aloud.");
    bindMethods("Hello", {{"greet",
                           &Hello::greet,
                           "Answers a greeting.",
                           {{"name", "Who to greet."}},
                           {"greeting", "\"Hello, \" followed by the name and \"!\"."}},
                          {"greetings",
                           &Hello::greetings,
                           "How many greetings so far.",
                           {},
                           {"count", "The number of greetings answered or spoken."}},
                          {"sayHello",
                           &Hello::sayHello,
                           "The robot says hello to someone with a wave; returns when it is done.",
                           {{"name", "Who to greet."}}}});
  }

  std::string greet(const std::string& name) {
    ++fGreetings;
    return "Hello, " + name + "!";
  }

  int greetings() { return fGreetings.load(); }

  void sayHello(const std::string& name) {
    ZU::ZUProxy mokuto("ZUMokuto", getParentBroker());
    mokuto.call<void>("say", "Hello ^start(animations/Stand/Gestures/Hey_1) " + name + "!");
    ++fGreetings;
  }

 private:
  std::atomic<int> fGreetings{0};
};

}  // namespace

extern "C" int _createModule(const std::shared_ptr<ZU::ZUBroker>& broker) {
  return ZU::createLibraryModule<Hello>(broker, "Hello");
}

extern "C" int _closeModule(const std::shared_ptr<ZU::ZUBroker>&) {
  return 0;
}
