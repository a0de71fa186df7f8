#pragma once
// ZUError: the exception of the module framework and of the service.
//
// It carries the module and method that raised it, a description, and the source file
// and line of the throw. Its text (what()) is built once at construction:
//   "\t" + module + "::" + method + "\n" + "\t" + description
// with the module piece and the "::" + method piece left out when they are empty.
// An instance is immutable after construction and may be read from any thread.

#include <exception>
#include <string>

namespace ZU {

class ZUError : public std::exception {
 public:
  ZUError(std::string moduleName, std::string methodName, std::string description,
          std::string sourceFile = {}, int sourceLine = 0);

  const char* what() const noexcept override { return fText.c_str(); }

  const std::string& moduleName() const noexcept { return fModuleName; }
  const std::string& methodName() const noexcept { return fMethodName; }
  const std::string& description() const noexcept { return fDescription; }
  const std::string& sourceFile() const noexcept { return fSourceFile; }
  int sourceLine() const noexcept { return fSourceLine; }

 private:
  std::string fModuleName;
  std::string fMethodName;
  std::string fDescription;
  std::string fSourceFile;
  int fSourceLine;
  std::string fText;
};

}  // namespace ZU

// Throws a ZUError that records the file and line of the throw.
#define ZU_THROW_ERROR(moduleName, methodName, description) \
  throw ::ZU::ZUError((moduleName), (methodName), (description), __FILE__, __LINE__)
