#pragma once
// The configuration record of the service: how a text is animated.
//
// A MokutoConfig is a plain value. The service keeps one as its current configuration
// (guarded by the module's reader/writer lock) and every text takes its own copy,
// which only that text's stages touch; the record itself has no lock.

#include <array>
#include <cstdint>
#include <map>
#include <ostream>
#include <set>
#include <string>
#include <vector>

#include "zu/enums.h"

namespace ZU {

class ZUValue;

class MokutoConfig {
 public:
  MokutoConfig();

  // Back to the defaults; keeps the first declared package only and leaves four
  // empty tag-to-animation maps.
  void reset();

  // Overlays the fields named in an array of [key, value] pairs; every problem is
  // logged and skipped, nothing is thrown.
  void fromZUValue(const ZUValue& value);
  // Adds [tag, [word...]] pairs to wordsToTags; logs and skips what is malformed.
  void updateWordsToTags(const ZUValue& value);
  // Adds [tag, [animation...]] pairs to tagsToAnimations, each animation under the
  // posture family that its path names. Throws std::out_of_range when a path is
  // shorter than a package tried before the matching one; what was stored before
  // stays.
  void updateTagsToAnimations(const ZUValue& value);
  // The posture family named by the folder that follows a package in the path;
  // Unknown (logged) when none does. Throws std::out_of_range as above.
  PostureFamily xPostureFamilyFormAnimPath(const std::string& path) const;

  BodyLanguageMode bodyLanguageMode;
  std::int32_t msPauseBeforeSpeech;
  std::string behaviorAtEndOfMokuto;
  bool ifBehaviorAtEndOfMokutoIsBlocking;
  bool armsBreathingAllowed;
  std::vector<std::string> animationsPackages;
  // word -> tags, in insertion order, duplicates kept
  std::map<std::string, std::vector<std::string>> wordsToTags;
  // per posture family (Standing, Sitting, SittingOnChair, Unknown): tag -> animations
  std::array<std::map<std::string, std::set<std::string>>, 4> tagsToAnimations;
  bool inputMode2;
};

// The printed form used by the diagnosis.
std::ostream& operator<<(std::ostream& os, const MokutoConfig& config);

}  // namespace ZU
