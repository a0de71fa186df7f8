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

struct NumberingCase {
  const char* name;
  std::vector<std::int32_t> callerBookmarks;
  std::vector<std::uint32_t> expectedIds;
};

class BookmarkNumbering : public testing::TestWithParam<NumberingCase> {};

TEST_P(BookmarkNumbering, SkipsTheCallersNumbers) {
  const NumberingCase& c = GetParam();
  MKTaskInstruction job;
  job.usedBookmarks = c.callerBookmarks;
  EXPECT_EQ(addActions(job, static_cast<int>(c.expectedIds.size())), c.expectedIds);

  std::vector<std::int32_t> expectedUsed = c.callerBookmarks;
  for (const std::uint32_t id : c.expectedIds) {
    expectedUsed.push_back(static_cast<std::int32_t>(id));
  }
  EXPECT_EQ(job.usedBookmarks, expectedUsed);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, BookmarkNumbering,
    testing::Values(NumberingCase{"none", {}, {1, 2, 3}},
                    NumberingCase{"oneAndTwo", {1, 2}, {3, 4}},
                    NumberingCase{"five", {5}, {1, 2, 3, 4, 6, 7}},
                    NumberingCase{"unsortedWithGaps", {4, 2, 3, 9}, {1, 5, 6, 7, 8, 10}},
                    NumberingCase{"duplicates", {2, 2, 1}, {3, 4}},
                    NumberingCase{"negativeAndZero", {-1, 0, -3}, {1, 2}},
                    NumberingCase{"farAhead", {1000}, {1, 2, 3}}),
    [](const testing::TestParamInfo<NumberingCase>& p) { return p.param.name; });

TEST(BookmarkNumberingLater, ContinuesFromTheLastActionAndHonoursLaterCallerNumbers) {
  MKTaskInstruction job;
  job.usedBookmarks = {3};
  EXPECT_EQ(addActions(job, 2), (std::vector<std::uint32_t>{1, 2}));
  // Automatic tags come after the parsed actions; a number recorded in between (as
  // another stage might) is skipped as well.
  job.usedBookmarks.push_back(5);
  EXPECT_EQ(addActions(job, 3), (std::vector<std::uint32_t>{4, 6, 7}));
}

TEST(BookmarkNumberingLater, ResetsTheCurrentActionToTheFirst) {
  MKTaskInstruction job;
  EXPECT_EQ(job.currentAction, job.actions.size());
  addActions(job, 2);
  job.currentAction = 2;
  addActions(job, 1);
  EXPECT_EQ(job.currentAction, 0u);
  EXPECT_EQ(job.actions.size(), 3u);
}

TEST(BookmarkNumberingLater, RefusesANullAction) {
  MKTaskInstruction job;
  EXPECT_THROW(job.addAction(nullptr), std::invalid_argument);
  EXPECT_TRUE(job.usedBookmarks.empty());
}

TEST(BookmarkText, KindFollowsTheType) {
  const std::vector<MKTaskActionType> blocking = {RUN_TAG,    RUN,       WAIT, WAIT_TAG,
                                                  WAIT_SOUND, RUN_SOUND, CALL};
  for (MKTaskActionType type = 0; type < static_cast<MKTaskActionType>(kMKTaskActionTypeCount);
       ++type) {
    if (type == INPUT_MODE2) {
      continue;
    }
    MKTaskAction action(type);
    action.id = 7;
    const bool isBlocking = std::find(blocking.begin(), blocking.end(), type) != blocking.end();
    EXPECT_EQ(action.bookmark(), isBlocking ? "\\mrkpause=7\\" : "\\mrk=7\\") << type;
  }
  MKTaskAction big(STOP);
  big.id = 4294967295u;
  EXPECT_EQ(big.bookmark(), "\\mrk=4294967295\\");
}

TEST(ActionRecords, ConstructionDefaults) {
  MKSoundAction sound(START_SOUND);
  EXPECT_EQ(sound.volume, 100);
  EXPECT_EQ(sound.id, 0u);
  EXPECT_TRUE(sound.soundSet.empty() && sound.soundName.empty() && sound.text.empty());
  ASSERT_NE(sound.condition, nullptr);

  MKCallAction call(CALL);
  EXPECT_EQ(call.proxy, nullptr);
  MKTaskAction other(STOP);
  EXPECT_NE(other.condition, call.condition);
}

TEST(ActionRecords, CopiesShareConditionAndProxy) {
  MKCallAction call(CALL);
  call.proxy = std::shared_ptr<ZUProxy>(static_cast<ZUProxy*>(nullptr), [](ZUProxy*) {});
  call.module = "ZUMemory";
  const MKCallAction copy(call);
  EXPECT_EQ(copy.condition, call.condition);
  EXPECT_EQ(copy.proxy.use_count(), call.proxy.use_count());
  EXPECT_GE(call.proxy.use_count(), 2);
  EXPECT_EQ(copy.module, "ZUMemory");

  auto shared = std::make_shared<MKCallAction>(call);
  std::shared_ptr<MKTaskAction> base = shared;
  EXPECT_EQ(base->condition, call.condition);
}

TEST(ActionRecords, ErrorPrefixTurnsTheRecordIntoUnknown) {
  MKSoundAction sound(RUN_SOUND);
  sound.text = "^runSound(a/b, 101)";
  sound.markAsError("SECOND_PARAMETER_NOT_VALID");
  EXPECT_EQ(sound.type, UNKNOWN);
  EXPECT_EQ(sound.text, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b, 101)");
  sound.id = 7;
  EXPECT_EQ(sound.bookmark(), "\\mrk=7\\");
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
  MKTaskInstruction job;
  job.text = "Hello \\mrk=1\\ world \\mrkpause=2\\";
  auto start = std::make_shared<MKAnimationAction>(START);
  start->text = "^start(a)";
  auto run = std::make_shared<MKAnimationAction>(RUN);
  run->text = "^run(b)";
  job.addAction(start);
  job.addAction(run);

  std::ostringstream fresh;
  fresh << job;
  EXPECT_EQ(fresh.str(),
            "Hello \\mrk=1\\ world \\mrkpause=2\\\n^start=1: ^start(a)\n^run=2: ^run(b)");

  job.currentAction = 1;
  std::ostringstream half;
  half << job;
  EXPECT_EQ(half.str(),
            "Hello \\mrk=1\\ world \\mrkpause=2\\\n^start=1: ^start(a)\taction already "
            "done\n^run=2: ^run(b)");

  job.currentAction = job.actions.size();
  std::ostringstream done;
  done << job;
  EXPECT_EQ(done.str(),
            "Hello \\mrk=1\\ world \\mrkpause=2\\\n^start=1: ^start(a)\taction already "
            "done\n^run=2: ^run(b)\taction already done");
}

TEST(PrintedForm, JobWithoutActionsIsItsText) {
  MKTaskInstruction job(4, "Bonjour à tous", MokutoConfig(), Sitting);
  std::ostringstream out;
  out << job;
  EXPECT_EQ(out.str(), "Bonjour à tous");
  EXPECT_EQ(job.id, 4);
  EXPECT_EQ(job.postureFamily, Sitting);
  EXPECT_FALSE(job.config.inputMode2);
}

}  // namespace
}  // namespace ZU
