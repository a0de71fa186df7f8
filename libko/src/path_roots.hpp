#pragma once
// The data roots of the framework as a function of where its library was loaded from, so
// that the installed and the build tree's orders can be checked without moving libraries.

#include <filesystem>
#include <string>
#include <vector>

namespace ko::path::detail {

// Where the framework's library lies and what the build knows about its trees.
struct Layout {
  std::filesystem::path libraryDirectory;       // the loaded library's directory; empty if unknown
  std::filesystem::path buildLibraryDirectory;  // where the build writes the library
  std::filesystem::path libraryToData;          // installed: from the library's to the data directory
  std::vector<std::string> buildRoots;          // the build tree's data roots
};

// The roots in search order for `layout` and a value of ZEFOKO_DATA_PATH.
std::vector<std::string> dataRoots(const Layout& layout, const std::string& variable);

}  // namespace ko::path::detail
