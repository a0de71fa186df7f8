#include "director_host.h"

#include "mokuto/mokutotimechecker.h"

namespace mokutotest {

namespace {
constexpr const char* kModuleClass = "DirectorHost";
}  // namespace

DirectorHost::DirectorHost(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                           ZU::ZURobotBodyTalkOptions bodyTalkOptions)
    : ZU::ZUModule(broker, name),
      fBodyTalk(std::make_unique<ZU::ZURobotBodyTalkInstance>(broker, bodyTalkOptions)),
      fDirector(std::make_shared<ZU::DirectorTask>(broker, fBodyTalk->bodyTalk, textRegister)) {
  bindMethods(kModuleClass,
              {{"_speechBookMarkCallback",
                &DirectorHost::_speechBookMarkCallback,
                "Hands a bookmark to the director.",
                {{"memoryKey", "The event."}, {"value", "The bookmark."}, {"message", "Unused."}}},
               {"_speechStatusCallback",
                &DirectorHost::_speechStatusCallback,
                "Hands a speech status to the director.",
                {{"memoryKey", "The event."}, {"value", "[id, status]."}, {"message", "Unused."}}},
               {"_mrkpauseCallback",
                &DirectorHost::_mrkpauseCallback,
                "Returns when the bookmark's action is done.",
                {{"pBookmark", "The bookmark."}}}});
}

DirectorHost::~DirectorHost() {
  fDirector.reset();
  fBodyTalk.reset();
}

void DirectorHost::init() {
  fDirector->subscribeToEvents();
}

void DirectorHost::exit() {
  {
    std::lock_guard lock(fExitMutex);
    if (fExited)
      return;
    fExited = true;
  }
  fDirector->stop(-1);
  fDirector->unsubscribeToEvents();
  ZU::ZUModule::exit();
}

void DirectorHost::stop(int id) {
  std::lock_guard lock(textRegister.textsMutex);
  if (textRegister.runningTexts.count(id) == 0)
    return;
  textRegister.textsToStop.insert(id);
  fDirector->stop(id);
}

void DirectorHost::_speechBookMarkCallback(const std::string& /*memoryKey*/,
                                           const ZU::ZUValue& value,
                                           const std::string& /*message*/) {
  fDirector->xOnBookmark(value);
}

void DirectorHost::_speechStatusCallback(const std::string& /*memoryKey*/, const ZU::ZUValue& value,
                                         const std::string& /*message*/) {
  fDirector->xOnSpeechStatus(value);
}

void DirectorHost::_mrkpauseCallback(int bookmark) {
  fDirector->xBookmarkReached(bookmark, true);
}

ZU::MKID DirectorHost::say(const std::shared_ptr<ZU::MKTaskInstruction>& instruction) {
  const ZU::MKID id = textRegister.newMKID(instruction, *this);
  instruction->postureFamily = bodyTalk()->getPostureFamily();
  const auto& timeChecker = fDirector->getTimeChecker();
  if (timeChecker->enabled())
    timeChecker->startOfMokuto(id);
  {
    std::lock_guard lock(fDirectorMutex);
    if (!textRegister.isMKIDStopped(id))
      fDirector->process(instruction);
  }
  textRegister.freeMKID(id);
  if (timeChecker->enabled())
    timeChecker->stopOfMokuto(id);
  return id;
}

}  // namespace mokutotest
