#include "zu/zuerror.h"

#include <utility>

namespace ZU {

ZUError::ZUError(std::string moduleName, std::string methodName, std::string description,
                 std::string sourceFile, int sourceLine)
    : fModuleName(std::move(moduleName)),
      fMethodName(std::move(methodName)),
      fDescription(std::move(description)),
      fSourceFile(std::move(sourceFile)),
      fSourceLine(sourceLine) {
  fText = "\t";
  fText += fModuleName;
  if (!fMethodName.empty()) {
    fText += "::";
    fText += fMethodName;
  }
  fText += "\n\t";
  fText += fDescription;
}

}  // namespace ZU
