#include "loadertask.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <exception>
#include <functional>
#include <iterator>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "mokuto.loader";

// The folders that name a posture family right after the package.
struct PostureFolder {
  std::string_view folder;
  PostureFamily family;
};
constexpr PostureFolder kPostureFolders[] = {
    {"Stand/", Standing}, {"Sit/", Sitting}, {"SitOnPod/", SittingOnChair}};

constexpr std::string_view kBodyTalkFolder = "BodyTalk/";
constexpr std::string_view kListeningFolder = "BodyTalk/Listening";
constexpr std::string_view kThinkingFolder = "BodyTalk/Thinking";

bool startsWith(std::string_view text, std::string_view prefix) {
  return text.size() >= prefix.size() && text.compare(0, prefix.size(), prefix) == 0;
}

bool isPostureFamily(PostureFamily family) {
  return family >= Standing && family < Unknown;
}

// The action as the record that its type calls for; raises std::invalid_argument when the
// record is of another class.
template <class Record>
Record& recordOf(MKTaskAction& action) {
  auto* record = dynamic_cast<Record*>(&action);
  if (!record)
    throw std::invalid_argument(action.text +
                                " is not held in the record of its type. "
                                "Instruction skipped.");
  return *record;
}

// How often a lookup that has not answered looks whether its text was stopped.
constexpr int kStopPollMs = 20;

// The service of that name through the session: in the local scope, then in any scope,
// each lookup bounded by the deadlock time-out and given up as soon as `stopped` answers
// true. Raises ZUError "Can't find service: <name>" (or that the text was stopped).
ko::AnyObject findService(const std::shared_ptr<ko::Session>& session, const std::string& name,
                          const std::function<bool()>& stopped) {
  if (!session)
    ZU_THROW_ERROR("ZUProxy", "ZUProxy", "Broker is invalid");
  using Clock = std::chrono::steady_clock;
  for (const char* scope : {"local", ""}) {
    const auto found = session->service(name, scope);
    const auto deadline = Clock::now() + std::chrono::milliseconds(ZUBroker::deadlockTimeout());
    ko::FutureState state = ko::FutureState::Timeout;
    for (;;) {
      const auto left =
          std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
      state = found.wait(static_cast<int>(std::clamp<std::int64_t>(left, 0, kStopPollMs)));
      if (state != ko::FutureState::Timeout || left <= 0)
        break;
      if (stopped && stopped())
        ZU_THROW_ERROR("ZUProxy", "ZUProxy",
                       "The lookup of the service " + name + " was given up: the text is stopped");
    }
    if (state == ko::FutureState::Timeout) {
      KO_LOG_ERROR(kCategory) << "session.service(" << name << ") "
                              << (*scope ? "timeout" : "timed out") << " after 30sec.";
    } else if (state == ko::FutureState::FinishedWithValue) {
      ko::AnyObject object = found.value();
      if (object && object->isValid())
        return object;
    }
  }
  ZU_THROW_ERROR("ZUProxy", "ZUProxy", "Can't find service: " + name);
}

// The proxy of a robot service, kept in `cached` while the service lives.
template <class Proxy>
std::shared_ptr<Proxy> lookUp(const std::shared_ptr<ko::Session>& session,
                              std::shared_ptr<Proxy>& cached) {
  if (cached && cached->isValid())
    return cached;
  cached.reset();
  cached = std::make_shared<Proxy>(findService(session, Proxy::kServiceName, nullptr));
  return cached;
}

}  // namespace

LoaderTask::LoaderTask(const std::shared_ptr<ZUBroker>& broker,
                       std::shared_ptr<ZURobotBodyTalkInstance> bodyTalkInstance)
    : session(broker ? broker->session() : nullptr), bodyTalk(std::move(bodyTalkInstance)) {}

LoaderTask::~LoaderTask() {
  abortUpdate();
}

std::shared_ptr<ZUBehaviorManagerProxy> LoaderTask::xBehaviorManager() {
  std::lock_guard lock(fServicesMutex);
  return lookUp(session, behaviorManager);
}

std::shared_ptr<ZUAudioPlayerProxy> LoaderTask::xAudioPlayer() {
  std::lock_guard lock(fServicesMutex);
  return lookUp(session, audioPlayer);
}

std::shared_ptr<ZUMemoryProxy> LoaderTask::xMemory() {
  std::lock_guard lock(fServicesMutex);
  return lookUp(session, memory);
}

// ---- the stage --------------------------------------------------------------------------

void LoaderTask::process(MKTaskInstruction& instruction, const std::function<bool()>& stopped) {
  // What the diagnosis prints of an action (its type and text) changes under the job's
  // mutex, taken only for that: never across a call of another service.
  const auto markAsError = [&instruction](MKTaskAction& action, std::string_view code) {
    std::lock_guard lock(instruction.mutex);
    action.markAsError(code);
  };
  const auto skip = [&instruction](MKTaskAction& action) {
    std::lock_guard lock(instruction.mutex);
    action.type = UNKNOWN;
  };
  {
    std::lock_guard lock(preloadMutex);
    preloadCounts.clear();
  }
  const PostureFamily family = instruction.postureFamily;
  for (const auto& held : instruction.actions) {
    if (!held)
      continue;
    MKTaskAction& action = *held;
    try {
      switch (action.type) {
        case START:
        case RUN:
        case WAIT:
        case STOP: {
          std::string& animation = recordOf<MKAnimationAction>(action).animation;
          std::string resolved;
          try {
            resolved = xBehaviorManager()->resolveBehaviorName(animation);
          } catch (const std::exception& e) {
            KO_LOG_ERROR(kCategory) << e.what();
            markAsError(action, "ANIMATION_NOT_FOUND");
            break;
          }
          if (resolved.empty()) {
            KO_LOG_ERROR(kCategory)
                << "Animation \"" << animation << "\" not found. Instruction skipped.";
            markAsError(action, "ANIMATION_NOT_FOUND");
          } else if (resolved == animation) {
            if (action.type == START)
              xRegisterPreload(animation);
          } else {
            KO_LOG_WARNING(kCategory) << "Animation name badly formatted given \"" << animation
                                      << "\" instead of \"" << resolved << "\".";
            animation = std::move(resolved);
          }
          break;
        }
        case AUTO_START_TAG:
        case START_TAG:
        case RUN_TAG:
        case WAIT_TAG:
        case STOP_TAG: {
          MKAnimationAction& tagAction = recordOf<MKAnimationAction>(action);
          if (!isPostureFamily(family)) {
            KO_LOG_WARNING(kCategory)
                << action.text
                << " action can't be done because the robot is in an unknown posture.";
            markAsError(action, "NO_ANIMATION_FOR_CURRENT_POSTURE");
            break;
          }
          std::lock_guard lock(tagsMutex);
          const auto index = static_cast<std::size_t>(family);
          const TagMap& configured = instruction.config.tagsToAnimations[index];
          const TagMap& installed = installedTags[index];
          const std::set<std::string>* candidates = nullptr;
          if (const auto it = configured.find(tagAction.tag); it != configured.end()) {
            candidates = &it->second;
          } else if (const auto found = installed.find(tagAction.tag); found != installed.end()) {
            candidates = &found->second;
          }
          // A configured tag without animations hides the installed ones and finds nothing.
          if (!candidates || candidates->empty()) {
            if (action.type != AUTO_START_TAG) {
              KO_LOG_WARNING(kCategory)
                  << "Tag \"" << tagAction.tag << "\" not found for the "
                  << postureFamilyToStr(family) << " posture. Instruction skipped.";
              markAsError(action, "NO_ANIMATION_FOR_CURRENT_POSTURE");
            }
            skip(action);
            break;
          }
          const std::set<std::string> choice = *candidates;
          const auto k = static_cast<std::size_t>(std::rand()) % choice.size();
          tagAction.animation = *std::next(choice.begin(), static_cast<std::ptrdiff_t>(k));
          xRegisterPreload(tagAction.animation);
          break;
        }
        case START_SOUND:
        case RUN_SOUND: {
          const std::string& soundSet = recordOf<MKSoundAction>(action).soundSet;
          try {
            xAudioPlayer()->loadSoundSet(soundSet);
          } catch (const std::exception& e) {
            KO_LOG_ERROR(kCategory) << e.what();
            markAsError(action, "SOUND_SET_NOT_FOUND");
          }
          break;
        }
        case CALL:
        case PCALL: {
          MKCallAction& call = recordOf<MKCallAction>(action);
          try {
            call.proxy =
                std::make_shared<ZUProxy>(findService(session, call.module, stopped), call.module);
          } catch (const std::exception& e) {
            KO_LOG_ERROR(kCategory) << e.what();
            markAsError(action, "MODULE_NOT_FOUND");
          }
          break;
        }
        default:
          break;
      }
    } catch (const std::exception& e) {
      // A record that does not fit its type, or no memory left: only this action is lost.
      KO_LOG_ERROR(kCategory) << e.what();
      skip(action);
    }
  }
  if (!instruction.config.behaviorAtEndOfMokuto.empty())
    xLoadAnimation(instruction.config.behaviorAtEndOfMokuto);
}

void LoaderTask::xLoadAnimation(const std::string& name) {
  try {
    xBehaviorManager()->preloadBehavior(name);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Could not preload behavior " << name << ": " << e.what();
  }
}

void LoaderTask::xRegisterPreload(const std::string& name) {
  std::lock_guard lock(preloadMutex);
  const auto it = preloadCounts.find(name);
  if (it == preloadCounts.end()) {
    xLoadAnimation(name);
    preloadCounts.emplace(name, 0);
  } else {
    ++it->second;
  }
}

void LoaderTask::onBehaviorStopped(const std::string& name) {
  std::lock_guard lock(preloadMutex);
  const auto it = preloadCounts.find(name);
  if (it == preloadCounts.end())
    return;
  if (it->second < 1) {
    preloadCounts.erase(it);
    return;
  }
  --it->second;
  try {
    xBehaviorManager()->post_preloadBehavior(name);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Could not preload behavior " << name << ": " << e.what();
  }
}

std::map<std::string, std::int32_t> LoaderTask::getPreloadCounts() const {
  std::lock_guard lock(preloadMutex);
  return preloadCounts;
}

// ---- the index --------------------------------------------------------------------------

void LoaderTask::updateRepresentations(const std::string& package) {
  std::lock_guard lock(tagsMutex);
  updateAborted.store(false);
  xRemovePackageAnimations(package);
  if (updateAborted.load())
    return;

  std::vector<std::string> paths;
  try {
    paths = xBehaviorManager()->getInstalledBehaviors();
  } catch (const std::exception& e) {
    KO_LOG_WARNING(kCategory)
        << "Error caught when calling behaviorManager.getInstalledBehaviors(): " << e.what();
    paths.clear();
  }

  BodyTalkLists speaking;
  BodyTalkLists listening;
  for (const auto& path : paths) {
    if (path.size() > package.size() && startsWith(path, package)) {
      const std::string_view rest = std::string_view(path).substr(package.size());
      for (const auto& [folder, family] : kPostureFolders) {
        if (startsWith(rest, folder)) {
          xUpdateAnAnimation(speaking, listening, family, path, package.size() + folder.size());
          break;
        }
      }
    }
    if (updateAborted.load())
      return;
  }

  if (package == kBodyTalkPackage)
    xHandToBodyTalk(speaking, listening);
}

void LoaderTask::xRemovePackageAnimations(const std::string& package) {
  for (auto& tags : installedTags) {
    for (auto tag = tags.begin(); tag != tags.end();) {
      std::set<std::string>& paths = tag->second;
      // The paths that begin with the package follow one another from the package on.
      auto last = paths.lower_bound(package);
      const auto first = last;
      while (last != paths.end() && startsWith(*last, package))
        ++last;
      paths.erase(first, last);
      tag = paths.empty() ? tags.erase(tag) : std::next(tag);
    }
  }
}

void LoaderTask::xUpdateAnAnimation(BodyTalkLists& speaking, BodyTalkLists& listening,
                                    PostureFamily family, const std::string& path,
                                    std::size_t offset) {
  const auto index = static_cast<std::size_t>(family);
  try {
    for (auto& tag : xBehaviorManager()->getBehaviorTags(path))
      installedTags[index][std::move(tag)].insert(path);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Error caught when calling behaviorManager.getBehaviorTags(): "
                            << e.what();
  }
  const std::string_view rest = std::string_view(path).substr(offset);
  if (startsWith(rest, kListeningFolder)) {
    listening[index].push_back(path);
  } else if (startsWith(rest, kBodyTalkFolder) && !startsWith(rest, kThinkingFolder)) {
    speaking[index].push_back(path);
  }
}

void LoaderTask::xHandToBodyTalk(const BodyTalkLists& speaking, const BodyTalkLists& listening) {
  ZURobotBodyTalk* const controller = bodyTalk ? bodyTalk->bodyTalk : nullptr;
  if (!controller)
    return;
  // Speaking for Standing, Sitting, SittingOnChair, then listening for the same; the
  // abort is tested after each call but the last.
  for (PostureFamily family = Standing; family < Unknown; ++family) {
    controller->setSpeakingAnimations(family, speaking[static_cast<std::size_t>(family)]);
    if (updateAborted.load())
      return;
  }
  for (PostureFamily family = Standing; family < Unknown; ++family) {
    controller->setListeningAnimations(family, listening[static_cast<std::size_t>(family)]);
    if (family != SittingOnChair && updateAborted.load())
      return;
  }
}

void LoaderTask::abortUpdate() {
  updateAborted.store(true);
  std::lock_guard lock(tagsMutex);
}

void LoaderTask::getMergedTags(TagMap& out) const {
  std::lock_guard lock(tagsMutex);
  out = installedTags[Standing];
  for (std::size_t family = Sitting; family < installedTags.size(); ++family) {
    for (const auto& [tag, paths] : installedTags[family])
      out[tag].insert(paths.begin(), paths.end());
  }
}

LoaderTask::TagMap LoaderTask::getInstalledTags(PostureFamily family) const {
  if (family < Standing || family > Unknown)
    return {};
  std::lock_guard lock(tagsMutex);
  return installedTags[static_cast<std::size_t>(family)];
}

void LoaderTask::subscribeToEvents() {
  try {
    const auto proxy = xMemory();
    proxy->subscribeToEvent(kBehaviorsAddedEvent, kModuleName, kUpdateCallback);
    proxy->subscribeToEvent(kBehaviorsRemovedEvent, kModuleName, kUpdateCallback);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUMemory.subscribeToEvent has thrown an exception: " << e.what();
  }
}

void LoaderTask::unsubscribeToEvents() {
  for (const char* event : {kBehaviorsAddedEvent, kBehaviorsRemovedEvent}) {
    try {
      xMemory()->unsubscribeToEvent(event, kModuleName);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUMemory.unsubscribeToEvent has thrown an exception: "
                              << e.what();
    }
  }
}

}  // namespace ZU
