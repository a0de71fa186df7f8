// The entry points of the service's module library: a host loads it and makes the module
// "ZUMokuto" on its broker.
#include "mokuto/zumokuto.h"
#include "zu/zumoduleentry.h"

extern "C" int _createModule(const std::shared_ptr<ZU::ZUBroker>& broker) {
  return ZU::createLibraryModule<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName);
}

extern "C" int _closeModule(const std::shared_ptr<ZU::ZUBroker>& /*broker*/) {
  return 0;
}
