#include "ko/path.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>

#include "ko_test_helpers.hpp"
#include "path_roots.hpp"

namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;

// Two data roots under a temporary directory, set as ZEFOKO_DATA_PATH for the test.
class FindDataTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(first_ / "zefoko" / "db");
    fs::create_directories(second_ / "zefoko" / "db");
    if (const char* old = std::getenv("ZEFOKO_DATA_PATH"))
      saved_ = old;
    setenv("ZEFOKO_DATA_PATH", (first_.string() + "::" + second_.string()).c_str(), 1);
  }
  void TearDown() override {
    saved_ ? setenv("ZEFOKO_DATA_PATH", saved_->c_str(), 1) : unsetenv("ZEFOKO_DATA_PATH");
  }
  static void touch(const fs::path& p) { std::ofstream(p) << "x"; }

  ko::test::ScratchFolder scratch_;
  fs::path first_ = scratch_.path() / "first";
  fs::path second_ = scratch_.path() / "second";
  std::optional<std::string> saved_;
};

TEST_F(FindDataTest, FirstDirectoryOfTheVariableWins) {
  touch(first_ / "zefoko" / "db" / "both.bdb");
  touch(second_ / "zefoko" / "db" / "both.bdb");
  touch(second_ / "zefoko" / "db" / "second.bdb");
  EXPECT_EQ(ko::path::findData("zefoko", "db/both.bdb"), (first_ / "zefoko/db/both.bdb").string());
  EXPECT_EQ(ko::path::findData("zefoko", "db/second.bdb"),
            (second_ / "zefoko/db/second.bdb").string());
  EXPECT_EQ(ko::path::findData("zefoko", "db/none.bdb"), "");
  EXPECT_EQ(ko::path::findData("other", "db/both.bdb"), "");
}

// The framework of the build tree: the variable's directories, then the build tree's.
TEST_F(FindDataTest, RootsInOrderAndExistingDirectories) {
  const auto roots = ko::path::dataRoots();
  ASSERT_EQ(roots.size(), 4u);  // the empty entry between "::" is skipped
  EXPECT_EQ(roots[0], first_.string());
  EXPECT_EQ(roots[1], second_.string());
  EXPECT_EQ(roots[2], KO_TEST_GENERATED_SHARE_DIR);
  EXPECT_EQ(roots[3], KO_TEST_BUILD_SHARE_DIR);
  EXPECT_THAT(
      ko::path::dataDirectories("zefoko"),
      ::testing::IsSupersetOf({(first_ / "zefoko").string(), (second_ / "zefoko").string()}));
  EXPECT_EQ(ko::path::dataDirectories("zefoko").front(), (first_ / "zefoko").string());
  EXPECT_TRUE(ko::path::dataDirectories("no-such-application").empty());
}

// An installed framework: its own prefix's data, then the variable's; never the build tree.
TEST(DataRoots, InstalledOrBuildTreeByWhereTheLibraryLies) {
  const struct {
    const char* library;
    const char* variable;
    std::vector<std::string> roots;
  } cases[] = {
      {"/b/libko", "/x::/y", {"/x", "/y", "/b/share", "/s/share"}},
      {"/b/libko", "", {"/b/share", "/s/share"}},
      {"/opt/r/lib/x86_64-linux-gnu", "", {"/opt/r/share"}},
      {"/opt/r/lib/x86_64-linux-gnu", "/x:", {"/opt/r/share", "/x"}},
      {"/b", "/x", {"/share", "/x"}},
      {"", "/x", {"/x"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.library) + " with " + c.variable);
    const ko::path::detail::Layout layout{
        c.library, "/b/libko", "../../share", {"/b/share", "/s/share"}};
    EXPECT_EQ(ko::path::detail::dataRoots(layout, c.variable), c.roots);
  }
}

TEST_F(FindDataTest, PathsLeavingTheDataDirectoryAreRefused) {
  touch(first_ / "secret.txt");
  touch(first_ / "zefoko" / "db" / "ok.bdb");
  for (const char* bad : {"", "../secret.txt", "db/../../secret.txt", "/etc/hostname"})
    EXPECT_EQ(ko::path::findData("zefoko", bad), "") << bad;
  EXPECT_EQ(ko::path::findData("zefoko", "db/./ok.bdb"), (first_ / "zefoko/db/ok.bdb").string());
  EXPECT_EQ(ko::path::findData("..", "secret.txt"), "");
}

}  // namespace
