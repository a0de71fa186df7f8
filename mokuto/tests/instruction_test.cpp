#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "mokuto/mktaskaction.h"
#include "mokuto/mktaskinstruction.h"

namespace ZU {
namespace {

std::vector<std::uint32_t> addActions(MKTaskInstruction& job, int count) {
  std::vector<std::uint32_t> ids;
  for (int k = 0; k < count; ++k) {
    auto action = std::make_shared<MKAnimationAction>(START);
    job.addAction(action);
    ids.push_back(action->id);
  }
  return ids;
}

// Automatic tags come after the parsed actions; a number recorded in between (as another
// stage might) is skipped as well. Each action added makes the first one current again.
TEST(BookmarkNumberingLater, ContinuesFromTheLastActionAndResetsTheCurrentAction) {
  MKTaskInstruction job;
  EXPECT_EQ(job.currentAction, job.actions.size());
  EXPECT_THROW(job.addAction(nullptr), std::invalid_argument);
  job.usedBookmarks = {3};
  EXPECT_EQ(addActions(job, 2), (std::vector<std::uint32_t>{1, 2}));
  job.usedBookmarks.push_back(5);
  job.currentAction = 2;
  EXPECT_EQ(addActions(job, 3), (std::vector<std::uint32_t>{4, 6, 7}));
  EXPECT_EQ(job.currentAction, 0u);
}

TEST(ActionRecords, EachHasItsConditionCopiesShareItAndTheProxy) {
  MKSoundAction sound(START_SOUND);
  EXPECT_EQ(sound.volume, 100);
  EXPECT_EQ(sound.id, 0u);
  ASSERT_NE(sound.condition, nullptr);
  EXPECT_NE(MKTaskAction(STOP).condition, sound.condition);

  MKCallAction call(CALL);
  EXPECT_EQ(call.proxy, nullptr);
  call.proxy = std::shared_ptr<ZUProxy>(static_cast<ZUProxy*>(nullptr), [](ZUProxy*) {});
  call.module = "ZUMemory";
  const MKCallAction copy(call);
  EXPECT_EQ(copy.condition, call.condition);
  EXPECT_EQ(copy.proxy.use_count(), 2);
  EXPECT_EQ(copy.module, "ZUMemory");
  std::shared_ptr<MKTaskAction> base = std::make_shared<MKCallAction>(call);
  EXPECT_EQ(base->condition, call.condition);
}

TEST(ActionRecords, AnErrorMakesTheRecordUnknownWithABookmarkOfKindMrk) {
  MKSoundAction sound(RUN_SOUND);
  sound.text = "^runSound(a/b, 101)";
  sound.markAsError("SECOND_PARAMETER_NOT_VALID");
  EXPECT_EQ(sound.type, UNKNOWN);
  EXPECT_EQ(sound.text, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b, 101)");
  sound.id = 4294967295u;
  EXPECT_EQ(sound.bookmark(), "\\mrk=4294967295\\");
}

TEST(KeywordTable, EveryWrittenKeywordMapsBackToItsType) {
  for (MKTaskActionType type = START_TAG; type <= AFFECTATION; ++type) {
    EXPECT_EQ(MKTaskActionType_fromStr(MKTaskActionType_toStr(type)), type)
        << MKTaskActionType_toStr(type);
  }
  EXPECT_EQ(MKTaskActionType_fromStr("UNKNOWN"), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_fromStr("^Start"), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_fromStr("^start "), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_fromStr(""), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_toStr(-1), "UNKNOWN");
  EXPECT_EQ(MKTaskActionType_toStr(19), "UNKNOWN");
  EXPECT_EQ(MKTaskActionType_bookmarkKind(INPUT_MODE2), "");
}

TEST(PrintedForm, MarksTheActionsBeforeTheCurrentOne) {
  const std::string text = R"(Hello \mrk=1\ world \mrkpause=2\)";
  MKTaskInstruction job(4, text, MokutoConfig(), Sitting);
  EXPECT_EQ(job.id, 4);
  EXPECT_EQ(job.postureFamily, Sitting);
  const auto printed = [&job] {
    std::ostringstream out;
    out << job;
    return out.str();
  };
  EXPECT_EQ(printed(), text);
  for (const auto& [type, written] : {std::pair{START, "^start(a)"}, std::pair{RUN, "^run(b)"}}) {
    auto action = std::make_shared<MKAnimationAction>(type);
    action->text = written;
    job.addAction(action);
  }
  const std::string start = text + "\n^start=1: ^start(a)";
  EXPECT_EQ(printed(), start + "\n^run=2: ^run(b)");
  job.currentAction = 1;
  EXPECT_EQ(printed(), start + "\taction already done\n^run=2: ^run(b)");
  job.currentAction = job.actions.size();
  EXPECT_EQ(printed(), start + "\taction already done\n^run=2: ^run(b)\taction already done");
}

}  // namespace
}  // namespace ZU
