// Fuzzes the arguments of "^call" and "^pCall" as the service takes them: the input is
// written between the parentheses of a call ("^call(ZUFuzz.take(" + input + "))"), the
// parser cuts the arguments out, the director's decoding turns them into a list of
// values, and the call goes to a service whose overloads take numbers, texts, lists and
// dynamic values, through the proxy that resolves the overload and converts the values.
// Every failure must be a ZUError; the input is also decoded alone, as a call's arguments
// whatever the parser made of it.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuproxy.h"
#include "zu/zuvalue.h"

namespace {

// Takes whatever the overloads accept, and looks at it.
class ZUFuzz : public ZU::ZUModule {
 public:
  ZUFuzz(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZU::ZUModule(broker, name) {
    bindMethods("ZUFuzz",
                {{"take", ZU::overload<int(int)>(&ZUFuzz::take)},
                 {"take", ZU::overload<int(const std::string&, double)>(&ZUFuzz::take)},
                 {"take", ZU::overload<int(const std::vector<std::string>&)>(&ZUFuzz::take)},
                 {"value", &ZUFuzz::value},
                 {"pair", &ZUFuzz::pair}});
  }
  int take(int n) { return n; }
  int take(const std::string& text, double x) { return static_cast<int>(text.size()) + (x > 0); }
  int take(const std::vector<std::string>& texts) { return static_cast<int>(texts.size()); }
  std::string value(const ZU::ZUValue& v) { return v.toString(2); }
  std::string pair(const ZU::ZUValue& a, const ZU::ZUValue& b) {
    return a.toString(1) + b.toString(1);
  }
};

struct Service {
  Service()
      : broker(ZU::ZUBroker::create(std::make_shared<ko::Session>())),
        module(ZU::ZUModule::createModule<ZUFuzz>(broker, "ZUFuzz")),
        proxy("ZUFuzz", broker) {}
  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<ZUFuzz> module;
  ZU::ZUProxy proxy;
};

Service& service() {
  static Service* const instance = new Service;  // lives to the end of the process
  return *instance;
}

// The call as the director makes it, with each of the methods.
void call(const ZU::MKCallAction& action) {
  std::vector<ko::AnyValue> arguments;
  try {
    arguments = action.argumentList();
  } catch (const ZU::ZUError&) {
    return;
  }
  for (const char* method : {"take", "value", "pair"}) {
    try {
      service().proxy.callArgs<ko::AnyValue>(method, arguments);
    } catch (const ZU::ZUError&) {
      // No overload takes them, or a value does not convert: the director logs it.
    }
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
  ko::log::setLevel("*", ko::log::Silent);
  service();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view input(reinterpret_cast<const char*>(data), size);

  ZU::MKCallAction alone(ZU::CALL);
  alone.module = "ZUFuzz";
  alone.arguments = "[" + std::string(input) + "]";
  call(alone);

  auto job = std::make_shared<ZU::MKTaskInstruction>();
  ZU::ZUMokutoParser().parse(job, "^call(ZUFuzz.take(" + std::string(input) + ")) said", false);
  for (const auto& action : job->actions) {
    const auto* parsed = dynamic_cast<const ZU::MKCallAction*>(action.get());
    if (parsed && parsed->type == ZU::CALL) {
      if (parsed->arguments.empty() || parsed->arguments.front() != '[' ||
          parsed->arguments.back() != ']')
        std::abort();  // the parser hands over a JSON array text
      call(*parsed);
    }
  }
  return 0;
}
