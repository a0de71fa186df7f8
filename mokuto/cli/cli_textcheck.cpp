#include "cli_textcheck.h"

#include <algorithm>
#include <optional>
#include <string_view>

#include "cli_common.h"
#include "mokuto/mktaskaction.h"

namespace mokuto::cli {

namespace {

constexpr auto npos = std::string::npos;

bool isNameByte(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9');
}

char lower(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

// The instruction names a text may write: every keyword that begins with "^", and the
// deprecated "^tag".
std::optional<std::string_view> keyword(std::string_view name, bool ignoreCase) {
  const auto same = [ignoreCase](std::string_view a, std::string_view b) {
    if (a.size() != b.size())
      return false;
    for (std::size_t k = 0; k < a.size(); ++k) {
      if (ignoreCase ? lower(a[k]) != lower(b[k]) : a[k] != b[k])
        return false;
    }
    return true;
  };
  for (const std::string_view candidate : ZU::kMKTaskActionKeywords) {
    if (candidate.size() > 1 && candidate[0] == '^' && same(candidate, name))
      return candidate;
  }
  if (same("^tag", name))
    return std::string_view("^tag");
  return std::nullopt;
}

// As the parser matches a closing parenthesis: from `from`, the ")" at depth 0 outside
// double quotes, a backslash hiding the byte after it; npos when there is none. Each
// byte walked is taken from `budget`; once it is spent, npos.
std::size_t closingParenthesis(const std::string& text, std::size_t from, std::size_t& budget) {
  int depth = 0;
  bool outside = true;
  for (std::size_t k = from; k < text.size(); ++k) {
    if (budget == 0)
      return npos;
    --budget;
    const char c = text[k];
    if (c == '\\') {
      ++k;
    } else if (!outside) {
      outside = c == '"';
    } else if (c == ')') {
      if (depth == 0)
        return k;
      --depth;
    } else if (c == '(') {
      ++depth;
    } else if (c == '"') {
      outside = false;
    }
  }
  return npos;
}

// Line and column of positions met in increasing order.
class Cursor {
 public:
  explicit Cursor(const std::string& text) : fText(text) {}
  TextWarning at(std::size_t position, std::string message) {
    for (; fPosition < position; ++fPosition) {
      const auto c = static_cast<unsigned char>(fText[fPosition]);
      if (c == '\n') {
        ++fLine;
        fColumn = 1;
      } else if ((c & 0xC0) != 0x80) {
        ++fColumn;
      }
    }
    return {fLine, fColumn, std::move(message)};
  }

 private:
  const std::string& fText;
  std::size_t fPosition = 0;
  std::size_t fLine = 1;
  std::size_t fColumn = 1;
};

std::string quoted(const std::string& text) {
  return "\"" + printable(text, 40) + "\"";
}

}  // namespace

std::vector<TextWarning> checkInstructions(const std::string& text) {
  std::vector<TextWarning> warnings;
  Cursor cursor(text);
  const std::size_t n = text.size();
  // The walks to closing parentheses cover a few times the text at most: a text of
  // thousands of unclosed parentheses is checked up to where they begin to cost.
  std::size_t budget = 8 * n + 100'000;
  std::size_t i = 0;
  while (i < n) {
    if (text[i] == '^') {
      std::size_t end = i + 1;
      while (end < n && isNameByte(text[end]))
        ++end;
      const std::string name = text.substr(i, end - i);
      std::size_t open = end;
      while (open < n && text[open] == ' ')
        ++open;
      const bool nameEnded = end < n && (text[end] == ' ' || text[end] == '(');
      if (nameEnded && open < n && text[open] == '(') {
        const std::size_t close = closingParenthesis(text, open + 1, budget);
        if (budget == 0) {
          warnings.push_back(cursor.at(i,
                                       "the check of the instructions stops here (too many "
                                       "parentheses without their closing one)"));
          return warnings;
        }
        if (close == npos) {
          warnings.push_back(cursor.at(
              i, quoted(name + "(") + " has no closing parenthesis: it is spoken as words"));
          i = open + 1;
          continue;
        }
        if (!keyword(name, false)) {
          std::string message = quoted(name) + " is not an instruction: skipped";
          if (const auto near = keyword(name, true))
            message += " (did you mean \"" + std::string(*near) + "\"?)";
          warnings.push_back(cursor.at(i, std::move(message)));
        }
        i = close + 1;
        continue;
      }
      if (const auto near = keyword(name, true)) {
        std::string message = quoted(name) + " is not followed by \"(\": it is spoken as words";
        if (*near != name)
          message += " (and the instruction is \"" + std::string(*near) + "\")";
        warnings.push_back(cursor.at(i, std::move(message)));
      }
      i = end;
      continue;
    }
    if (text[i] == '$') {
      // As the parser reads "$name=value": up to the first space, the name ending at the
      // last "=".
      const std::size_t end = std::min(text.find(' ', i + 1), n);
      const std::size_t equal = text.rfind('=', end - 1);
      if (equal != npos && equal > i) {
        const bool hasName = equal > i + 1;
        const bool hasValue = equal + 1 < end;
        if (!hasName || !hasValue) {
          warnings.push_back(cursor.at(i, quoted(text.substr(i, end - i)) + " has no " +
                                              (hasName ? "value" : "name") +
                                              ": it is spoken as words"));
        }
        i = end;
        continue;
      }
      std::size_t next = end;
      while (next < n && text[next] == ' ')
        ++next;
      if (end > i + 1 && next < n && text[next] == '=') {
        warnings.push_back(cursor.at(i, quoted(text.substr(i, end - i)) +
                                            " is followed by a blank before \"=\": it is "
                                            "spoken as words (write \"$name=value\")"));
      }
    }
    ++i;
  }
  return warnings;
}

}  // namespace mokuto::cli
