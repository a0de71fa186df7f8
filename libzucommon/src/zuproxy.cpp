#include "zu/zuproxy.h"

#include "zu/zubroker.h"

namespace ZU {

namespace {

constexpr const char* kModule = "ZUProxy";

// A remote failure as a ZUError: a text in the ZUError form ("\tmodule::method\n\t
// description") gives back the remote module's error; any other text is described as a
// failure of the call of `method`.
ZUError remoteError(std::string_view method, const std::string& text) {
  if (!text.empty() && text.front() == '\t') {
    const auto end = text.find("\n\t");
    if (end != std::string::npos) {
      const std::string header = text.substr(1, end - 1);
      const std::string description = text.substr(end + 2);
      const auto sep = header.find("::");
      if (sep == std::string::npos)
        return ZUError(header, "", description);
      return ZUError(header.substr(0, sep), header.substr(sep + 2), description);
    }
  }
  return ZUError(kModule, std::string(method), text);
}

std::string noSingleMatch(const std::string& service, std::string_view method,
                          const std::vector<std::string>& candidates) {
  std::string text = "ZUProxy(" + service + ").pcall Can't find single match for " +
                     std::string(method) + "\n  Candidate(s):\n";
  for (std::size_t i = 0; i < candidates.size(); ++i)
    text += (i ? "\n" : "") + candidates[i];
  return text;
}

}  // namespace

ZUProxy::ZUProxy(const std::string& name, const std::shared_ptr<ZUBroker>& broker)
    : fServiceName(name) {
  if (!broker)
    ZU_THROW_ERROR(kModule, "ZUProxy", "Broker is invalid");
  fObject = broker->service(name);
  if (!fObject)
    ZU_THROW_ERROR(kModule, "ZUProxy", "Can't find service: " + name);
}

ZUProxy::ZUProxy(ko::AnyObject object, std::string name)
    : fObject(std::move(object)), fServiceName(std::move(name)) {
  if (!fObject)
    ZU_THROW_ERROR(kModule, "ZUProxy", "Object is invalid");
  if (fServiceName.empty())
    fServiceName = fObject->label();
}

ZUProxy::~ZUProxy() = default;

void ZUProxy::xThrowGone(std::string_view method, const char* goneText) const {
  if (!fObject)
    ZU_THROW_ERROR(kModule, std::string(method), "Invalid GenericObject");
  ZU_THROW_ERROR(kModule, std::string(method), goneText);
}

void ZUProxy::xThrowConversionError(std::string_view method,
                                    const ko::ResultConversionError& e) const {
  ZU_THROW_ERROR(kModule, std::string(method),
                 "Return argument conversion error: " + std::string(e.what()));
}

std::shared_ptr<ko::DynamicObject> ZUProxy::xLiveObject(std::string_view method,
                                                        const char* goneText) const {
  std::shared_ptr<ko::DynamicObject> object = fObject ? fObject->dynamicObject() : nullptr;
  if (!object)
    xThrowGone(method, goneText);
  return object;
}

ko::AnyValue ZUProxy::xCall(std::string_view method, const std::vector<ko::AnyValue>& args,
                            const char* goneText) const {
  // Held for the whole call: the service cannot go away under it.
  const std::shared_ptr<ko::DynamicObject> object = xLiveObject(method, goneText);

  // A name with one method of the right arity is the common case; overloads and every
  // failure go through ko's resolution.
  unsigned id = 0;
  const ko::MetaObject& meta = object->metaObject();
  const std::vector<unsigned>* ids = meta.methodIds(method);
  if (ids && ids->size() == 1 && meta.method(ids->front())->arity == args.size()) {
    id = ids->front();
  } else {
    try {
      id = fObject->resolveMethod(method, args);
    } catch (const ko::Error& e) {
      throw remoteError(method, e.what());
    }
  }

  ko::Future<ko::AnyValue> result = object->metaCall(id, args, ko::MetaCallType::Direct);
  try {
    return std::move(result).value();
  } catch (const ko::FutureError& e) {
    throw remoteError(method, e.what());
  }
}

int ZUProxy::xPCall(std::string_view method, const std::vector<ko::AnyValue>& args,
                    const char* goneText) const {
  const std::shared_ptr<ko::DynamicObject> object = xLiveObject(method, goneText);

  unsigned id = 0;
  try {
    id = fObject->resolveMethod(method, args);
  } catch (const ko::OverloadError& e) {
    ZU_THROW_ERROR(kModule, "pCall", noSingleMatch(fServiceName, method, e.candidates()));
  } catch (const ko::Error&) {
    if (!fObject->isValid())
      xThrowGone(method, goneText);
    ZU_THROW_ERROR(kModule, "pCall", noSingleMatch(fServiceName, method, {}));
  }
  const std::vector<ko::AnyValue> taskArgs{ko::AnyValue(static_cast<int>(id)),
                                           ko::AnyValue::list(args)};
  return xConvert<int>("__pCall", xCall("__pCall", taskArgs, goneText));
}

bool ZUProxy::wait(int id, int timeoutPeriod) const {
  return call<bool>("wait", id, timeoutPeriod);
}

void ZUProxy::stop(int id) const {
  call<void>("stop", id);
}

bool ZUProxy::isRunning(int id) const {
  return call<bool>("isRunning", id);
}

}  // namespace ZU
