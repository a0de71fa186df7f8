#include "evalcall.h"

#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <limits>

namespace zefoko {

namespace {

constexpr std::size_t kMaxLength = 8192;
constexpr int kMaxDepth = 8;

class Parser {
 public:
  explicit Parser(std::string_view text) : fText(text) {}

  EvalCall call() {
    EvalCall out;
    blanks();
    out.module = identifier("a module name");
    expect('.');
    out.method = identifier("a method name");
    blanks();
    expect('(');
    blanks();
    if (!accept(')')) {
      for (;;) {
        out.arguments.push_back(value(0));
        blanks();
        if (accept(')'))
          break;
        expect(',');
        blanks();
      }
    }
    blanks();
    if (fAt != fText.size())
      fail("nothing may follow the call");
    return out;
  }

 private:
  [[noreturn]] void fail(const std::string& reason) const { throw EvalSyntaxError(reason, fAt); }

  char peek() const { return fAt < fText.size() ? fText[fAt] : '\0'; }
  bool atEnd() const { return fAt >= fText.size(); }

  void blanks() {
    while (!atEnd() && (peek() == ' ' || peek() == '\t'))
      ++fAt;
  }

  bool accept(char c) {
    if (atEnd() || peek() != c)
      return false;
    ++fAt;
    return true;
  }

  void expect(char c) {
    if (!accept(c))
      fail(std::string("expected '") + c + "'" + (atEnd() ? " at the end" : ""));
  }

  static bool isStart(char c) { return std::isalpha(static_cast<unsigned char>(c)) || c == '_'; }
  static bool isPart(char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; }

  std::string identifier(const char* what) {
    if (atEnd() || !isStart(peek()))
      fail(std::string("expected ") + what);
    const std::size_t start = fAt;
    while (!atEnd() && isPart(peek()))
      ++fAt;
    return std::string(fText.substr(start, fAt - start));
  }

  ko::AnyValue value(int depth) {
    const char c = peek();
    if (c == '\'' || c == '"')
      return string(c);
    if (c == '[')
      return list(depth);
    if (c == '-' || c == '+' || std::isdigit(static_cast<unsigned char>(c)) || c == '.')
      return number();
    if (isStart(c)) {
      const std::size_t start = fAt;
      const std::string word = identifier("a value");
      if (word == "true" || word == "True")
        return ko::AnyValue(true);
      if (word == "false" || word == "False")
        return ko::AnyValue(false);
      fAt = start;
      fail("'" + word + "' is not a literal: only strings, numbers, true, false and lists");
    }
    fail(atEnd() ? "expected a value at the end" : "expected a value");
  }

  ko::AnyValue string(char quote) {
    ++fAt;
    std::string out;
    for (;;) {
      if (atEnd())
        fail("the string has no closing quote");
      const char c = fText[fAt++];
      if (c == quote)
        return ko::AnyValue(std::move(out));
      if (static_cast<unsigned char>(c) < 0x20)
        fail("a control character in a string");
      if (c != '\\') {
        out += c;
        continue;
      }
      if (atEnd())
        fail("the string has no closing quote");
      switch (const char e = fText[fAt++]) {
        case '\\':
        case '\'':
        case '"':
          out += e;
          break;
        case 'n':
          out += '\n';
          break;
        case 't':
          out += '\t';
          break;
        default:
          --fAt;
          fail(std::string("unknown escape \\") + e);
      }
    }
  }

  ko::AnyValue list(int depth) {
    if (depth >= kMaxDepth)
      fail("lists nested deeper than " + std::to_string(kMaxDepth));
    ++fAt;
    ko::AnyValue::List items;
    blanks();
    if (accept(']'))
      return ko::AnyValue::list(std::move(items));
    for (;;) {
      items.push_back(value(depth + 1));
      blanks();
      if (accept(']'))
        return ko::AnyValue::list(std::move(items));
      expect(',');
      blanks();
    }
  }

  ko::AnyValue number() {
    const std::size_t start = fAt;
    if (peek() == '-' || peek() == '+')
      ++fAt;
    bool decimal = false;
    std::size_t digits = 0;
    while (!atEnd()) {
      const char c = peek();
      if (std::isdigit(static_cast<unsigned char>(c))) {
        ++digits;
      } else if (c == '.' || c == 'e' || c == 'E') {
        decimal = true;
        if ((c == 'e' || c == 'E') && fAt + 1 < fText.size() &&
            (fText[fAt + 1] == '-' || fText[fAt + 1] == '+'))
          ++fAt;
      } else {
        break;
      }
      ++fAt;
    }
    std::string_view text = fText.substr(start, fAt - start);
    if (!text.empty() && text.front() == '+')
      text.remove_prefix(1);
    const char* first = text.data();
    const char* last = text.data() + text.size();
    if (digits == 0) {
      fAt = start;
      fail("expected a number");
    }
    if (!decimal) {
      std::int64_t v = 0;
      const auto [end, error] = std::from_chars(first, last, v);
      if (error != std::errc() || end != last) {
        fAt = start;
        fail("the integer is out of range");
      }
      const bool small = v >= std::numeric_limits<std::int32_t>::min() &&
                         v <= std::numeric_limits<std::int32_t>::max();
      return small ? ko::AnyValue(static_cast<std::int32_t>(v)) : ko::AnyValue(v);
    }
    double v = 0;
    const auto [end, error] = std::from_chars(first, last, v);
    if (error != std::errc() || end != last || !std::isfinite(v)) {
      fAt = start;
      fail("not a number");
    }
    return ko::AnyValue(v);
  }

  std::string_view fText;
  std::size_t fAt = 0;
};

}  // namespace

EvalSyntaxError::EvalSyntaxError(const std::string& reason, std::size_t position)
    : std::runtime_error(reason + " (at character " + std::to_string(position + 1) + ")"),
      fPosition(position) {}

EvalCall parseEvalCall(std::string_view text) {
  if (text.size() > kMaxLength)
    throw EvalSyntaxError("the call is longer than " + std::to_string(kMaxLength) + " bytes", 0);
  return Parser(text).call();
}

}  // namespace zefoko
