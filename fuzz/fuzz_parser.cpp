// Fuzzes the annotated-text parser. The first byte chooses the language (its low bit:
// Japanese or not), the rest is the text. Besides the sanitizers' checks, every input
// must give a job that keeps the parser's promises; a broken one aborts.
#include <algorithm>
#include <charconv>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <string_view>
#include <typeinfo>
#include <vector>

#include "ko/log.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace {

using ZU::MKTaskInstruction;
using Matching = ZU::ZUMokutoParser::Matching;

[[noreturn]] void fail(const char* what, const std::string& text) {
  std::fprintf(stderr, "parser invariant broken: %s\ntext (%zu bytes): %s\n", what, text.size(),
               text.c_str());
  std::abort();
}

#define CHECK(condition)            \
  do {                              \
    if (!(condition)) {             \
      fail(#condition, callerText); \
    }                               \
  } while (false)

// The numbers of the caller's own "\mrk=N\" tags, read as the parser's first pass
// reads them: from a backslash, "\mrk=" with at least 7 bytes left, up to the next
// backslash, then on after it.
std::vector<std::int32_t> callerBookmarks(std::string_view t) {
  std::vector<std::int32_t> numbers;
  std::size_t i = 0;
  while ((i = t.find('\\', i)) != std::string_view::npos) {
    if (t.size() - i < 7 || t.substr(i, 5) != "\\mrk=") {
      ++i;
      continue;
    }
    const std::size_t end = t.find('\\', i + 5);
    if (end == std::string_view::npos) {
      break;
    }
    std::string_view digits = t.substr(i + 5, end - i - 5);
    if (!digits.empty() && digits[0] == '+' && (digits.size() < 2 || digits[1] != '-')) {
      digits.remove_prefix(1);
    }
    std::int32_t n = 0;
    const auto [last, ec] = std::from_chars(digits.data(), digits.data() + digits.size(), n);
    if (!digits.empty() && ec == std::errc() && last == digits.data() + digits.size()) {
      numbers.push_back(n);
    }
    i = end + 1;
  }
  return numbers;
}

bool startsWith(std::string_view s, std::string_view prefix) {
  return s.substr(0, prefix.size()) == prefix;
}

// Everything the parser writes, for comparing two parses.
std::string describe(const MKTaskInstruction& job) {
  std::ostringstream out;
  out << job << '\n' << job.config.inputMode2;
  for (const auto n : job.usedBookmarks) {
    out << ' ' << n;
  }
  for (const auto& action : job.actions) {
    const ZU::MKTaskAction& record = *action;
    out << '\n' << record.type << ' ' << typeid(record).name();
    if (const auto* a = dynamic_cast<const ZU::MKAnimationAction*>(action.get())) {
      out << '|' << a->animation << '|' << a->tag;
    } else if (const auto* s = dynamic_cast<const ZU::MKSoundAction*>(action.get())) {
      out << '|' << s->soundSet << '|' << s->soundName << '|' << s->volume;
    } else if (const auto* c = dynamic_cast<const ZU::MKCallAction*>(action.get())) {
      out << '|' << c->module << '|' << c->method << '|' << c->arguments;
    } else if (const auto* m = dynamic_cast<const ZU::MKModeAction*>(action.get())) {
      out << '|' << m->mode;
    } else if (const auto* f = dynamic_cast<const ZU::MKAffectationAction*>(action.get())) {
      out << '|' << f->name << '|' << f->value;
    }
  }
  return out.str();
}

std::shared_ptr<MKTaskInstruction> parse(const std::string& text, bool japanese,
                                         Matching matching) {
  auto job = std::make_shared<MKTaskInstruction>();
  ZU::ZUMokutoParser(matching).parse(job, text, japanese);
  return job;
}

void checkAction(const ZU::MKTaskAction& action, const std::string& callerText) {
  const std::string_view text = action.text;
  if (action.type == ZU::UNKNOWN) {
    if (startsWith(text, "UNKNOWN_INSTRUCTION ^")) {
      CHECK(typeid(action) == typeid(ZU::MKTaskAction));
    } else if (startsWith(text, "BODY_LANGUAGE_MODE_UNKNOWN ^mode(")) {
      const auto* mode = dynamic_cast<const ZU::MKModeAction*>(&action);
      CHECK(mode != nullptr && mode->mode == ZU::BODY_LANGUAGE_MODE_END_OF_ENUM);
    } else if (startsWith(text, "SECOND_PARAMETER_NOT_VALID ^")) {
      const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(&action);
      CHECK(sound != nullptr && sound->volume == 100);
    } else if (startsWith(text, "INSTRUCTION_BADLY_FORMATTED ^")) {
      const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(&action);
      const auto* call = dynamic_cast<const ZU::MKCallAction*>(&action);
      CHECK(sound != nullptr || call != nullptr);
      CHECK(sound == nullptr || (sound->soundSet.empty() && sound->soundName.empty()));
    } else {
      fail("an UNKNOWN action without an error code", callerText);
    }
    CHECK(text.back() == ')');
    return;
  }

  CHECK(action.type >= ZU::START_TAG && action.type <= ZU::AFFECTATION);
  CHECK(action.type != ZU::INPUT_MODE2);
  if (action.type == ZU::AFFECTATION) {
    const auto* affectation = dynamic_cast<const ZU::MKAffectationAction*>(&action);
    CHECK(affectation != nullptr);
    CHECK(!affectation->name.empty() && !affectation->value.empty());
    CHECK(text == "$" + affectation->name + "=" + affectation->value);
    CHECK(text.find(' ') == std::string_view::npos);
    CHECK(affectation->value.find('=') == std::string::npos);
    return;
  }

  // "^name(content)" with the content trimmed of spaces.
  const std::string_view keyword = ZU::MKTaskActionType_toStr(action.type);
  std::string_view name = keyword;
  if (action.type == ZU::START_TAG && startsWith(text, "^tag(")) {
    name = "^tag";
  }
  CHECK(startsWith(text, name) && text.size() >= name.size() + 2 && text[name.size()] == '(' &&
        text.back() == ')');
  const std::string_view content = text.substr(name.size() + 1, text.size() - name.size() - 2);
  CHECK(content.empty() || (content.front() != ' ' && content.back() != ' '));

  if (action.type <= ZU::STOP_TAG) {
    const auto* animation = dynamic_cast<const ZU::MKAnimationAction*>(&action);
    CHECK(animation != nullptr);
    const bool byPath = action.type == ZU::START || action.type == ZU::RUN ||
                        action.type == ZU::WAIT || action.type == ZU::STOP;
    CHECK((byPath ? animation->animation : animation->tag) == content);
    CHECK((byPath ? animation->tag : animation->animation).empty());
  } else if (action.type == ZU::MODE) {
    const auto* mode = dynamic_cast<const ZU::MKModeAction*>(&action);
    CHECK(mode != nullptr && mode->mode >= 0 && mode->mode <= 2);
    CHECK(content == ZU::bodyLanguageModeToStr(mode->mode));
  } else if (action.type <= ZU::RUN_SOUND) {
    const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(&action);
    CHECK(sound != nullptr && sound->volume >= 0 && sound->volume <= 100);
    CHECK(startsWith(content, sound->soundSet + "/"));
    CHECK(content.substr(sound->soundSet.size() + 1, sound->soundName.size()) == sound->soundName);
    CHECK(sound->soundName.find('/') == std::string::npos);
    CHECK(content.find('(') == std::string_view::npos);
  } else {
    const auto* call = dynamic_cast<const ZU::MKCallAction*>(&action);
    CHECK(call != nullptr && call->proxy == nullptr);
    CHECK(!call->module.empty() && !call->method.empty());
    CHECK(startsWith(content, call->module + "." + call->method));
    CHECK(call->arguments.size() >= 2 && call->arguments.front() == '[' &&
          call->arguments.back() == ']');
    CHECK(content.find(call->arguments.substr(1, call->arguments.size() - 2)) !=
          std::string_view::npos);
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
  ko::log::setLevel("*", ko::log::Silent);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) {
    return 0;
  }
  const bool japanese = (data[0] & 1) != 0;
  const std::string callerText(reinterpret_cast<const char*>(data + 1), size - 1);

  const auto job = parse(callerText, japanese, Matching::Adaptive);

  // The same job whichever way the closing parentheses are found.
  const std::string described = describe(*job);
  CHECK(describe(*parse(callerText, japanese, Matching::Index)) == described);
  CHECK(describe(*parse(callerText, japanese, Matching::Walk)) == described);

  // usedBookmarks: the caller's numbers, then the actions' numbers, each the smallest
  // number above the previous action's that the caller did not use.
  const std::vector<std::int32_t> caller = callerBookmarks(callerText);
  const std::set<std::int64_t> callerSet(caller.begin(), caller.end());
  CHECK(job->usedBookmarks.size() == caller.size() + job->actions.size());
  CHECK(std::equal(caller.begin(), caller.end(), job->usedBookmarks.begin()));
  std::int64_t previous = 0;
  std::size_t searchFrom = 0;
  std::size_t dollarsAndCarets = 0;
  for (const char c : callerText) {
    dollarsAndCarets += (c == '^' || c == '$') ? 1 : 0;
  }
  CHECK(job->actions.size() <= dollarsAndCarets);
  for (std::size_t k = 0; k < job->actions.size(); ++k) {
    const ZU::MKTaskAction& action = *job->actions[k];
    std::int64_t expected = previous + 1;
    while (callerSet.count(expected) != 0) {
      ++expected;
    }
    CHECK(action.id == expected);
    CHECK(job->usedBookmarks[caller.size() + k] == static_cast<std::int64_t>(action.id));
    previous = action.id;

    // Bookmarks are in the speech text in the actions' order.
    const std::string bookmark = action.bookmark();
    const std::size_t at = job->text.find(bookmark, searchFrom);
    CHECK(at != std::string::npos);
    searchFrom = at + bookmark.size();
    CHECK(startsWith(bookmark, action.type == ZU::RUN_TAG || action.type == ZU::RUN ||
                                       action.type == ZU::WAIT || action.type == ZU::WAIT_TAG ||
                                       action.type == ZU::WAIT_SOUND ||
                                       action.type == ZU::RUN_SOUND || action.type == ZU::CALL
                                   ? "\\mrkpause="
                                   : "\\mrk="));
    checkAction(action, callerText);
  }
  CHECK(job->currentAction == 0);

  // Without instructions the words pass unchanged; the language only matters to pauses.
  if (dollarsAndCarets == 0 && !japanese) {
    CHECK(job->text == callerText && job->actions.empty() && !job->config.inputMode2);
  }
  if (callerText.find("\\pau=") == std::string::npos) {
    CHECK(describe(*parse(callerText, !japanese, Matching::Adaptive)) == described);
  }
  if (job->config.inputMode2) {
    CHECK(callerText.find("^inputMode2") != std::string::npos);
  }
  return 0;
}
