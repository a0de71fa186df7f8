#pragma once
// The exceptions of the ko framework.

#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace ko {

// Every failure raised by the framework (sessions, objects, calls, tasks).
class Error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Raised when reading a future that finished with an error, was canceled or timed out;
// what() is the error text carried by the future.
class FutureError : public Error {
 public:
  using Error::Error;
};

// Raised when a call by name matches no method or several: what() lists the candidates.
class OverloadError : public Error {
 public:
  OverloadError(std::string message, std::string method, std::string argumentsSignature,
                std::vector<std::string> candidates)
      : Error(std::move(message)),
        method_(std::move(method)),
        argumentsSignature_(std::move(argumentsSignature)),
        candidates_(std::move(candidates)) {}
  const std::string& method() const noexcept { return method_; }
  // The signature of the arguments given, "(is)".
  const std::string& argumentsSignature() const noexcept { return argumentsSignature_; }
  // The signatures of the methods of that name, "say::(s)".
  const std::vector<std::string>& candidates() const noexcept { return candidates_; }

 private:
  std::string method_;
  std::string argumentsSignature_;
  std::vector<std::string> candidates_;
};

// Raised when a call's result cannot be read as the type the caller asked for.
// what() is "Unable to convert call result to target type: from <source> to <target>".
class ResultConversionError : public Error {
 public:
  ResultConversionError(std::string sourceSignature, std::string targetSignature)
      : Error("Unable to convert call result to target type: from " + sourceSignature + " to " +
              targetSignature),
        source_(std::move(sourceSignature)),
        target_(std::move(targetSignature)) {}
  const std::string& sourceSignature() const noexcept { return source_; }
  const std::string& targetSignature() const noexcept { return target_; }

 private:
  std::string source_;
  std::string target_;
};

}  // namespace ko
