#include "mokuto/mktaskinstruction.h"

#include <algorithm>
#include <charconv>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

#include "ko/json.hpp"
#include "zu/zuerror.h"

namespace ZU {

MKTaskAction::MKTaskAction(MKTaskActionType actionType)
    : type(actionType), condition(std::make_shared<std::condition_variable>()) {}

void MKTaskAction::appendBookmark(std::string& out) const {
  // backslash, kind (8 bytes at most), "=", 10 digits at most, backslash
  char buffer[32];
  const std::string_view kind = MKTaskActionType_bookmarkKind(type);
  char* end = buffer;
  *end++ = '\\';
  end = std::copy(kind.begin(), kind.end(), end);
  *end++ = '=';
  end = std::to_chars(end, buffer + sizeof buffer, id).ptr;
  *end++ = '\\';
  out.append(buffer, end);
}

std::string MKTaskAction::bookmark() const {
  std::string out;
  appendBookmark(out);
  return out;
}

std::vector<ko::AnyValue> MKCallAction::argumentList() const {
  try {
    return ko::fromJson(arguments).to<std::vector<ko::AnyValue>>();
  } catch (const ko::JsonError& e) {
    // The decoder's words, without its tag ("[json.exception.parse_error.101] ").
    std::string_view why = e.what();
    if (const auto tag = why.find("] "); why.rfind("[json.exception.", 0) == 0 && tag != why.npos)
      why.remove_prefix(tag + 2);
    ZU_THROW_ERROR(module, method, "the arguments are not JSON: " + std::string(why));
  } catch (const ko::ConversionError&) {
    ZU_THROW_ERROR(module, method, "the arguments are not a list");
  }
}

void MKTaskAction::markAsError(std::string_view code) {
  type = UNKNOWN;
  std::string prefixed;
  prefixed.reserve(code.size() + 1 + text.size());
  prefixed += code;
  prefixed += ' ';
  prefixed += text;
  text = std::move(prefixed);
}

MKTaskInstruction::MKTaskInstruction(MKID textId, std::string callerText, MokutoConfig textConfig,
                                     PostureFamily family)
    : id(textId),
      config(std::move(textConfig)),
      text(std::move(callerText)),
      postureFamily(family) {}

void MKTaskInstruction::addAction(std::shared_ptr<MKTaskAction> action) {
  if (!action) {
    throw std::invalid_argument("MKTaskInstruction::addAction: null action");
  }
  std::int64_t n = actions.empty() ? 0 : static_cast<std::int64_t>(actions.back()->id);

  // Numbers at or below lastGiven_ were dropped from bookmarksAhead_; start over if the
  // count now starts below them or if usedBookmarks was replaced.
  if (n < lastGiven_ || usedBookmarks.size() < usedSeen_) {
    bookmarksAhead_.clear();
    aheadFrom_ = 0;
    usedSeen_ = 0;
    lastGiven_ = n;
  }
  if (usedSeen_ < usedBookmarks.size()) {
    bookmarksAhead_.erase(bookmarksAhead_.begin(),
                          bookmarksAhead_.begin() + static_cast<std::ptrdiff_t>(aheadFrom_));
    aheadFrom_ = 0;
    for (std::size_t k = usedSeen_; k < usedBookmarks.size(); ++k) {
      if (usedBookmarks[k] > n) {
        bookmarksAhead_.push_back(usedBookmarks[k]);
      }
    }
    std::sort(bookmarksAhead_.begin(), bookmarksAhead_.end());
  }

  bool taken = true;
  while (taken) {
    ++n;
    while (aheadFrom_ < bookmarksAhead_.size() && bookmarksAhead_[aheadFrom_] < n) {
      ++aheadFrom_;
    }
    taken = aheadFrom_ < bookmarksAhead_.size() && bookmarksAhead_[aheadFrom_] == n;
  }

  usedBookmarks.push_back(static_cast<std::int32_t>(n));
  usedSeen_ = usedBookmarks.size();
  lastGiven_ = n;
  action->id = static_cast<std::uint32_t>(n);
  actions.push_back(std::move(action));
  currentAction = 0;
}

std::ostream& operator<<(std::ostream& os, const MKTaskInstruction& job) {
  os << job.text;
  for (std::size_t k = 0; k < job.actions.size(); ++k) {
    const MKTaskAction* action = job.actions[k].get();
    if (action == nullptr) {
      continue;
    }
    os << '\n' << MKTaskActionType_toStr(action->type) << '=' << action->id << ": " << action->text;
    if (k < job.currentAction) {
      os << "\taction already done";
    }
  }
  return os;
}

}  // namespace ZU
