#pragma once
// A temporary folder for one test, deleted with everything in it at the end of its scope.

#include <filesystem>
#include <string>

namespace robotsim::simtest {

class ScratchFolder {
 public:
  ScratchFolder();
  ~ScratchFolder();
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;

  const std::filesystem::path& path() const noexcept { return fPath; }
  // Writes `text` to the file at `relative` (folders created as needed).
  void write(const std::string& relative, const std::string& text) const;

 private:
  std::filesystem::path fPath;
};

}  // namespace robotsim::simtest
