#pragma once
// The places of an annotated text where a "^" or a "$" looks like an instruction that the
// parser does not take as the writer meant: "^start(" without its closing parenthesis or
// "^wait y" without its parenthesis (both spoken as words), an unknown instruction name
// (skipped), "$x=" or "$x =1" (spoken as words). The scan follows the parser's own rules
// for names, parentheses, double quotes and backslashes.
#include <cstddef>
#include <string>
#include <vector>

namespace mokuto::cli {

struct TextWarning {
  // From 1; the column counts characters (UTF-8), not bytes.
  std::size_t line = 1;
  std::size_t column = 1;
  std::string message;
};

std::vector<TextWarning> checkInstructions(const std::string& text);

}  // namespace mokuto::cli
