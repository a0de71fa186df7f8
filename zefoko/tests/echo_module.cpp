// A module library for the host's tests: "ZUEcho" answers its argument, and "ZUFaulty"
// (made when the environment asks for it) cannot be created.
#include <cstdlib>
#include <string>

#include "zu/zumoduleentry.h"

namespace {

class ZUEcho : public ZU::ZUModule {
 public:
  ZUEcho(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZU::ZUModule(broker, name) {
    setModuleDescription("Answers what it is given.");
    bindMethods("ZUEcho", {{"echo",
                            &ZUEcho::echo,
                            "Answers its argument.",
                            {{"text", "Any text."}},
                            {"echoed", "The same text."}}});
  }
  std::string echo(const std::string& text) { return text; }
};

}  // namespace

extern "C" int _createModule(const std::shared_ptr<ZU::ZUBroker>& broker) {
  if (std::getenv("ZUECHO_FAIL"))
    ZU_THROW_ERROR("ZUEcho", "_createModule", "asked to fail");
  return ZU::createLibraryModule<ZUEcho>(broker, "ZUEcho");
}

extern "C" int _closeModule(const std::shared_ptr<ZU::ZUBroker>&) {
  return 0;
}
