#pragma once
// The action records of the annotated-text language: one record per instruction of a
// text, each tied to a bookmark of the speech text by its number.
//
// A record is filled by the compiler stage's thread, then read by the loader and the
// director; the records of one text are shared (by shared pointer) between the stages
// that work on it in turn. Copies of a record share its condition variable and its
// call proxy, on which the director and its callbacks synchronise.

#include <array>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "zu/enums.h"

namespace ZU {

class ZUProxy;

using MKTaskActionType = std::int32_t;
enum : MKTaskActionType {
  AUTO_START_TAG = 0,
  START_TAG = 1,
  START = 2,
  RUN_TAG = 3,
  RUN = 4,
  WAIT = 5,
  WAIT_TAG = 6,
  STOP = 7,
  STOP_TAG = 8,
  MODE = 9,
  START_SOUND = 10,
  STOP_SOUND = 11,
  WAIT_SOUND = 12,
  RUN_SOUND = 13,
  CALL = 14,
  PCALL = 15,
  INPUT_MODE2 = 16,
  AFFECTATION = 17,
  UNKNOWN = 18,
};
inline constexpr std::size_t kMKTaskActionTypeCount = 19;

// The instruction names, indexed by action type.
inline constexpr std::array<std::string_view, kMKTaskActionTypeCount> kMKTaskActionKeywords = {
    "AUTO_START_TAG", "^startTag",   "^start",     "^runTag",   "^run",
    "^wait",          "^waitTag",    "^stop",      "^stopTag",  "^mode",
    "^startSound",    "^stopSound",  "^waitSound", "^runSound", "^call",
    "^pCall",         "^inputMode2", "$",          "UNKNOWN"};

// The speech engine's bookmark kind of each action type: "mrkpause" for the blocking
// ones (the speech waits for the action), "mrk" for the others.
inline constexpr std::array<std::string_view, kMKTaskActionTypeCount> kMKTaskActionBookmarkKinds = {
    "mrk", "mrk", "mrk",      "mrkpause", "mrkpause", "mrkpause", "mrkpause", "mrk", "mrk", "mrk",
    "mrk", "mrk", "mrkpause", "mrkpause", "mrkpause", "mrk",      "",         "mrk", "mrk"};

// The keyword of a type; "UNKNOWN" for a value outside the enumeration.
inline std::string_view MKTaskActionType_toStr(MKTaskActionType type) noexcept {
  if (type < 0 || static_cast<std::size_t>(type) >= kMKTaskActionTypeCount) {
    return kMKTaskActionKeywords[UNKNOWN];
  }
  return kMKTaskActionKeywords[static_cast<std::size_t>(type)];
}

// The bookmark kind of a type; "mrk" for a value outside the enumeration.
inline std::string_view MKTaskActionType_bookmarkKind(MKTaskActionType type) noexcept {
  if (type < 0 || static_cast<std::size_t>(type) >= kMKTaskActionTypeCount) {
    return kMKTaskActionBookmarkKinds[UNKNOWN];
  }
  return kMKTaskActionBookmarkKinds[static_cast<std::size_t>(type)];
}

// The type of an instruction name: exact match against the keywords of the types 0 to
// 17; the deprecated "^tag" gives START_TAG (with a warning); anything else UNKNOWN.
MKTaskActionType MKTaskActionType_fromStr(std::string_view name);

class MKTaskAction {
 public:
  // With a fresh condition variable of its own.
  explicit MKTaskAction(MKTaskActionType actionType);
  // With a condition variable that the caller made for this record alone (the parser
  // makes those of a text a block at a time).
  MKTaskAction(MKTaskActionType actionType, std::shared_ptr<std::condition_variable> ownCondition)
      : type(actionType), condition(std::move(ownCondition)) {}
  MKTaskAction(const MKTaskAction&) = default;
  MKTaskAction& operator=(const MKTaskAction&) = default;
  MKTaskAction(MKTaskAction&&) = default;
  MKTaskAction& operator=(MKTaskAction&&) = default;
  virtual ~MKTaskAction() = default;

  // "\mrk=3\" or "\mrkpause=4\": the tag that stands for this action in the speech text.
  std::string bookmark() const;
  // Appends bookmark() to `out`.
  void appendBookmark(std::string& out) const;
  // Turns the record into an UNKNOWN one whose text starts with `code` and a space.
  void markAsError(std::string_view code);

  MKTaskActionType type;
  std::uint32_t id = 0;
  std::string text;
  std::shared_ptr<std::condition_variable> condition;
};

class MKAnimationAction : public MKTaskAction {
 public:
  explicit MKAnimationAction(MKTaskActionType actionType) : MKTaskAction(actionType) {}
  MKAnimationAction(MKTaskActionType actionType,
                    std::shared_ptr<std::condition_variable> ownCondition)
      : MKTaskAction(actionType, std::move(ownCondition)) {}

  std::string animation;
  std::string tag;
};

class MKSoundAction : public MKTaskAction {
 public:
  explicit MKSoundAction(MKTaskActionType actionType) : MKTaskAction(actionType) {}
  MKSoundAction(MKTaskActionType actionType, std::shared_ptr<std::condition_variable> ownCondition)
      : MKTaskAction(actionType, std::move(ownCondition)) {}

  std::string soundSet;
  std::string soundName;
  std::int32_t volume = 100;
};

class MKCallAction : public MKTaskAction {
 public:
  explicit MKCallAction(MKTaskActionType actionType) : MKTaskAction(actionType) {}
  MKCallAction(MKTaskActionType actionType, std::shared_ptr<std::condition_variable> ownCondition)
      : MKTaskAction(actionType, std::move(ownCondition)) {}

  // The service to call; looked up by the loader stage, empty until then.
  std::shared_ptr<ZUProxy> proxy;
  std::string module;
  std::string method;
  // The argument list as a JSON array text: "[\"hello\", 2]", possibly "[]".
  std::string arguments;

  // The arguments decoded from their text, as the call hands them to the service. Raises
  // ZUError (module, method) when the text is no JSON array.
  std::vector<ko::AnyValue> argumentList() const;
};

class MKModeAction : public MKTaskAction {
 public:
  explicit MKModeAction(MKTaskActionType actionType) : MKTaskAction(actionType) {}
  MKModeAction(MKTaskActionType actionType, std::shared_ptr<std::condition_variable> ownCondition)
      : MKTaskAction(actionType, std::move(ownCondition)) {}

  BodyLanguageMode mode = BODY_LANGUAGE_MODE_END_OF_ENUM;
};

class MKAffectationAction : public MKTaskAction {
 public:
  explicit MKAffectationAction(MKTaskActionType actionType) : MKTaskAction(actionType) {}
  MKAffectationAction(MKTaskActionType actionType,
                      std::shared_ptr<std::condition_variable> ownCondition)
      : MKTaskAction(actionType, std::move(ownCondition)) {}

  std::string name;
  std::string value;
};

}  // namespace ZU
