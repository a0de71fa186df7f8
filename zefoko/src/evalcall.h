#pragma once
// The calls that a module's page may ask of the host ("?eval="): one call of a published
// method, `Module.method('text', 12, 0.5, true, [1, 2])`, whose arguments are literals
// only. The text is parsed strictly and never evaluated: strings in single or double
// quotes (with the escapes \\ \' \" \n \t), integers, decimal numbers, true and false,
// and lists of them.
//
// Pure functions: any thread.

#include <cstddef>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "ko/anyvalue.hpp"

namespace zefoko {

struct EvalCall {
  std::string module;
  std::string method;
  std::vector<ko::AnyValue> arguments;
};

// What is wrong with a text, and at which byte.
class EvalSyntaxError : public std::runtime_error {
 public:
  EvalSyntaxError(const std::string& reason, std::size_t position);
  std::size_t position() const noexcept { return fPosition; }

 private:
  std::size_t fPosition;
};

// Raises EvalSyntaxError for anything but one such call (blanks around its parts allowed).
EvalCall parseEvalCall(std::string_view text);

}  // namespace zefoko
