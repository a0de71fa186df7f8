// The calls that a module's page may ask for: one call with literal arguments, parsed
// strictly; everything else refused with the reason and where. And the addresses that the
// pages are served at. The viewer's page of a recorded performance: everything inside it,
// nothing that the performance's own texts could close or run.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "evalcall.h"
#include "httpserver.h"
#include "ko/json.hpp"
#include "zefoko/viewer.h"

namespace zefoko {
namespace {

TEST(EvalCall, TakesOneCallWithLiteralArguments) {
  struct Case {
    std::string text;
    std::string module, method;
    std::string arguments;  // as JSON
  };
  const std::vector<Case> cases = {
      {"ZUBehaviorManager.runBehavior('animations/Stand/Gestures/Hey_1')", "ZUBehaviorManager",
       "runBehavior", R"(["animations/Stand/Gestures/Hey_1"])"},
      {"  M.m ( 'a' , \"b\" ,12,-3, 0.5, -1e-3, +2, true, False ) ", "M", "m",
       R"(["a","b",12,-3,0.5,-0.001,2,true,false])"},
      {"M.m()", "M", "m", "[]"},
      {"M.m('it\\'s \\\"q\\\" \\\\ \\n\\t', \"'\")", "M", "m", R"(["it's \"q\" \\ \n\t","'"])"},
      {"ZUMotion.setAngles(['HeadYaw', 'HeadPitch'], [0.1, [ ]], 1)", "ZUMotion", "setAngles",
       R"([["HeadYaw","HeadPitch"],[0.1,[]],1])"},
      {"M.m(9000000000)", "M", "m", "[9000000000]"},
      {"M.m('ロボット')", "M", "m", R"(["ロボット"])"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    const EvalCall call = parseEvalCall(c.text);
    EXPECT_EQ(call.module, c.module);
    EXPECT_EQ(call.method, c.method);
    EXPECT_EQ(ko::toJson(ko::AnyValue::list(call.arguments)), nlohmann::json::parse(c.arguments));
  }
}

TEST(EvalCall, RefusesAnythingElseWithTheReason) {
  struct Case {
    std::string text;
    std::string reason;
    std::size_t position;
  };
  const std::vector<Case> cases = {
      {"", "expected a module name", 0},
      {"runBehavior('x')", "expected '.'", 11},
      {"M.m('x'); alert(1)", "nothing may follow the call", 8},
      {"M.m('x')//", "nothing may follow the call", 8},
      {"M['m']('x')", "expected '.'", 1},
      {"M.m.n('x')", "expected '('", 3},
      {"M.m(x)", "'x' is not a literal", 4},
      {"M.m(document.URL)", "'document' is not a literal", 4},
      {"M.m(animations/Stand/A)", "'animations' is not a literal", 4},
      {"M.m('x'", "expected ',' at the end", 7},
      {"M.m('x',)", "expected a value", 8},
      {"M.m('x)", "the string has no closing quote", 7},
      {"M.m('\\x41')", "unknown escape \\x", 6},
      {"M.m(1.2.3)", "not a number", 4},
      {"M.m(1e999)", "not a number", 4},
      {"M.m(99999999999999999999)", "the integer is out of range", 4},
      {"M.m(-)", "expected a number", 4},
      {"M.m([[[[[[[[[1]]]]]]]]])", "lists nested deeper than 8", 12},
      {"M.m('a\nb')", "a control character in a string", 7},
      {"M.m(`x`)", "expected a value", 4},
      {"M.m(() => 1)", "expected a value", 4},
      {"1M.m()", "expected a module name", 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    try {
      parseEvalCall(c.text);
      ADD_FAILURE() << "taken";
    } catch (const EvalSyntaxError& e) {
      EXPECT_EQ(std::string(e.what()).rfind(c.reason, 0), 0u) << e.what();
      EXPECT_EQ(e.position(), c.position) << e.what();
    }
  }
  EXPECT_THROW(parseEvalCall("M.m('" + std::string(9000, 'a') + "')"), EvalSyntaxError);
}

TEST(HttpAddress, ReadsAddressAndPortAndTellsLoopback) {
  struct Case {
    std::string text;
    std::string address;  // empty: refused
    int port;
    bool loopback;
  };
  const std::vector<Case> cases = {
      {"127.0.0.1:8080", "127.0.0.1", 8080, true},
      {"localhost:0", "localhost", 0, true},
      {"[::1]:65535", "::1", 65535, true},
      {"127.1.2.3:80", "127.1.2.3", 80, true},
      {"0.0.0.0:8080", "0.0.0.0", 8080, false},
      {"[::]:8080", "::", 8080, false},
      {"192.168.1.2:1", "192.168.1.2", 1, false},
      {"8080", "", 0, false},
      {"127.0.0.1:", "", 0, false},
      {":8080", "", 0, false},
      {"127.0.0.1:65536", "", 0, false},
      {"127.0.0.1:80a", "", 0, false},
      {"[::1:80", "", 0, false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    if (c.address.empty()) {
      EXPECT_THROW(parseHttpAddress(c.text), HttpError);
      continue;
    }
    const HttpOptions options = parseHttpAddress(c.text);
    EXPECT_EQ(options.address, c.address);
    EXPECT_EQ(options.port, c.port);
    EXPECT_EQ(isLoopbackAddress(options.address), c.loopback);
  }
}

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
    EXPECT_NE(
        page.find("Hi &lt;/script&gt;&lt;script&gt;alert(&#39;x&#39;)&lt;/script&gt; &amp; bye"),
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
