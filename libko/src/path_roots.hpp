#pragma once
// The data roots of the framework as a function of where its library was loaded from, so
// that the installed and the build tree's orders can be checked without moving libraries.

#include <filesystem>
#include <string>
#include <vector>

namespace ko::path::detail {

// Where the framework's library lies and what the build knows about its trees.
struct Layout {
  // The directory of the loaded library; empty when unknown.
  std::filesystem::path libraryDirectory;
  // Where the build writes the library.
  std::filesystem::path buildLibraryDirectory;
  // In an installation, the data directory relative to the library's.
  std::filesystem::path libraryToData;
  // The build tree's data roots.
  std::vector<std::string> buildRoots;
};

// The roots in search order for `layout` and a value of ZEFOKO_DATA_PATH.
std::vector<std::string> dataRoots(const Layout& layout, const std::string& variable);

}  // namespace ko::path::detail
