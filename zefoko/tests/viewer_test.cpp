// The viewer's page of a recorded performance: everything inside it, nothing that the
// performance's own texts could close or run.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "zefoko/viewer.h"

namespace zefoko {
namespace {

std::size_t count(const std::string& text, const std::string& part) {
  std::size_t n = 0;
  for (auto at = text.find(part); at != std::string::npos; at = text.find(part, at + 1))
    ++n;
  return n;
}

TEST(ViewerPage, HoldsTheAudioAndTheTimelineAndEscapesTheTexts) {
  struct Case {
    std::string wav;
    std::string audio;  // as the page holds it
  };
  const std::vector<Case> cases = {{"abc", "YWJj"}, {"ab", "YWI="}, {"a", "YQ=="}, {"", ""}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.wav);
    viewer::RecordedPerformance performance;
    performance.title = "say <b>";
    performance.text = "Hi </script><script>alert('x')</script> & bye";
    performance.entries.push_back({{"us", 5},
                                   {"service", "ZUMemory"},
                                   {"operation", "raiseEvent"},
                                   {"arguments", {"</script><!--", 1}}});
    performance.wav = c.wav;
    const std::string page = viewer::performancePage(performance);
    EXPECT_NE(page.find("src=\"data:audio/wav;base64," + c.audio + "\""), std::string::npos);
    EXPECT_NE(page.find("<h1>say &lt;b&gt;</h1>"), std::string::npos);
    EXPECT_NE(page.find("Hi &lt;/script&gt;&lt;script&gt;alert(&#39;x&#39;)&lt;/script&gt; &amp; bye"),
              std::string::npos);
    EXPECT_NE(page.find(R"(["\u003c/script>\u003c!--",1])"), std::string::npos);
    // The page's own two scripts, and no other.
    EXPECT_EQ(count(page, "<script"), 2u);
    EXPECT_EQ(count(page, "</script>"), 2u);
    EXPECT_EQ(page.find("{{"), std::string::npos);
  }
}

}  // namespace
}  // namespace zefoko
