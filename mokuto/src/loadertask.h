#pragma once
// LoaderTask: the second stage of the say pipeline, and the index of the animation library.
//
// As the index it maps, per posture family, each tag to the installed animations that
// carry it, rebuilt one package at a time from the behaviour manager (at the module's
// start, when a package is declared, when behaviours are added or removed); the same pass
// hands the body talk its speaking and listening animations ("BodyTalk/" of the package
// "animations/").
//
// As the stage it prepares every action of a job before the speech: animation names are
// checked and normalised, tags become one animation of the job's posture family (the
// job's configuration table first, then the index, a random choice among the
// candidates), sound sets are loaded, called services looked up, and the animations that
// the text starts are preloaded. An action that cannot be prepared becomes UNKNOWN with an
// error code in front of its text. A table counts the further starts of each preloaded
// animation, so that each stop of one that will start again preloads it once more.
//
// Threads: process runs in the thread of a say caller (one text at a time, under the
// module's loader lock). updateRepresentations runs in whichever thread asks for it (the
// framework's event loop at start, the memory's delivery thread, a caller of
// declareAnimationsPackage); updates, tag lookups and getMergedTags are serialised by the
// tags mutex, which an update holds while it calls the behaviour manager and the body
// talk. onBehaviorStopped comes from the thread that relays the behaviour manager's
// stops; it meets process on the preload mutex, which process holds across the
// synchronous preload of a new animation. abortUpdate may come from any thread; the abort
// flag is read by the update between its steps. Lock order: tags mutex, then preload mutex.
//
// The loader holds the framework session, never the broker (which holds the module that
// owns the loader); the services are looked up through the session when first needed and
// again when the one found has gone.

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "mokuto/mktaskinstruction.h"
#include "zu/enums.h"

namespace ko {
class Session;
}

namespace ZU {

class ZUBroker;
class ZUAudioPlayerProxy;
class ZUBehaviorManagerProxy;
class ZUMemoryProxy;
struct ZURobotBodyTalkInstance;

class LoaderTask {
 public:
  // Tag to the animations that carry it.
  using TagMap = std::map<std::string, std::set<std::string>>;

  // The module whose callbacks the memory events reach, and the callback's name.
  static constexpr const char* kModuleName = "ZUMokuto";
  static constexpr const char* kUpdateCallback = "_updateRepresentations";
  static constexpr const char* kBehaviorsAddedEvent = "ZUBehaviorManager/BehaviorsAdded";
  static constexpr const char* kBehaviorsRemovedEvent = "ZUBehaviorManager/BehaviorsRemoved";
  // The package whose "BodyTalk/" folder feeds the body talk.
  static constexpr const char* kBodyTalkPackage = "animations/";

  // `broker` gives the session (not kept); `bodyTalk` may be null (the body talk lists
  // then go nowhere). Looks no service up yet.
  LoaderTask(const std::shared_ptr<ZUBroker>& broker,
             std::shared_ptr<ZURobotBodyTalkInstance> bodyTalk);
  // Aborts an update in progress and waits for its end.
  ~LoaderTask();
  LoaderTask(const LoaderTask&) = delete;
  LoaderTask& operator=(const LoaderTask&) = delete;

  // ---- the stage ----
  // Prepares every action of the job; never throws (each failure marks its action). The
  // services of calls are looked up as the framework looks services up, each scope bounded
  // by the deadlock time-out; `stopped` (may be empty) ends such a lookup when it answers
  // true. The job's mutex is taken only to change an action's type and text (what the
  // diagnosis prints), never across a call of another service.
  void process(MKTaskInstruction& instruction, const std::function<bool()>& stopped = {});
  // A behaviour has stopped: if the current text starts it again, preloads it again
  // (without waiting); after its last expected start its entry goes.
  void onBehaviorStopped(const std::string& name);
  // The animations preloaded for the current text, each with the number of further
  // starts expected.
  std::map<std::string, std::int32_t> getPreloadCounts() const;

  // ---- the index ----
  // Rebuilds the entries of one package ("animations/", ending with "/").
  void updateRepresentations(const std::string& package);
  // Abandons an update in progress; returns once no update runs.
  void abortUpdate();
  // Whether an abort came since the last update began.
  bool isUpdateAborted() const noexcept { return updateAborted.load(); }
  // The maps of all posture families merged into `out` (union of the sets per tag).
  void getMergedTags(TagMap& out) const;
  // A copy of one posture family's map; empty for a value outside the enumeration.
  TagMap getInstalledTags(PostureFamily family) const;
  // Subscribes kModuleName's kUpdateCallback to the behaviour manager's "added" and
  // "removed" events; failures are logged.
  void subscribeToEvents();
  void unsubscribeToEvents();

 private:
  // Per posture family (Standing, Sitting, SittingOnChair, Unknown), paths in the order
  // of the behaviour manager's list.
  using BodyTalkLists = std::array<std::vector<std::string>, 4>;

  // Preloads one behaviour and waits; a failure is logged.
  void xLoadAnimation(const std::string& name);
  // Counts one expected start; the first one preloads.
  void xRegisterPreload(const std::string& name);

  // With tagsMutex held.
  void xRemovePackageAnimations(const std::string& package);
  void xUpdateAnAnimation(BodyTalkLists& speaking, BodyTalkLists& listening, PostureFamily family,
                          const std::string& path, std::size_t offset);
  // Hands the lists to the body talk, unless the update is aborted meanwhile.
  void xHandToBodyTalk(const BodyTalkLists& speaking, const BodyTalkLists& listening);

  // The services, looked up through the session when missing or gone; raise ZUError
  // "Can't find service: <name>" when not found.
  std::shared_ptr<ZUBehaviorManagerProxy> xBehaviorManager();
  std::shared_ptr<ZUAudioPlayerProxy> xAudioPlayer();
  std::shared_ptr<ZUMemoryProxy> xMemory();

  const std::shared_ptr<ko::Session> session;
  const std::shared_ptr<ZURobotBodyTalkInstance> bodyTalk;

  std::mutex fServicesMutex;  // the three proxies
  std::shared_ptr<ZUBehaviorManagerProxy> behaviorManager;
  std::shared_ptr<ZUAudioPlayerProxy> audioPlayer;
  std::shared_ptr<ZUMemoryProxy> memory;

  mutable std::mutex preloadMutex;
  std::map<std::string, std::int32_t> preloadCounts;

  mutable std::mutex tagsMutex;
  std::array<TagMap, 4> installedTags;
  std::atomic<bool> updateAborted{false};
};

}  // namespace ZU
