#include "ko/path.hpp"

#include <dlfcn.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "path_roots.hpp"

namespace ko::path {

namespace fs = std::filesystem;

namespace {
// A relative path that stays inside the directory it is appended to.
bool isContained(const fs::path& relative) {
  if (relative.empty() || relative.is_absolute() || relative.has_root_name())
    return false;
  int depth = 0;
  for (const auto& part : relative.lexically_normal()) {
    if (part == "..") {
      if (--depth < 0)
        return false;
    } else if (part != "." && !part.empty()) {
      ++depth;
    }
  }
  return true;
}

// Any object of this library: its address tells the dynamic linker's file name.
const int kAnchor = 0;

// The directory of the loaded framework library, with the build's layout; resolved once.
const detail::Layout& layout() {
  static const detail::Layout value = [] {
    detail::Layout l;
    Dl_info info{};
    std::error_code ec;
    if (::dladdr(&kAnchor, &info) != 0 && info.dli_fname) {
      const fs::path library = fs::canonical(info.dli_fname, ec);
      if (!ec)
        l.libraryDirectory = library.parent_path();
    }
    // Compared as written (resolved by the build): an installed library never touches it.
    l.buildLibraryDirectory = KO_BUILD_LIBRARY_DIR;
    l.libraryToData = KO_LIBRARY_TO_DATA_DIR;
    l.buildRoots = {KO_GENERATED_SHARE_DIR, KO_BUILD_SHARE_DIR};
    return l;
  }();
  return value;
}
}  // namespace

namespace detail {

std::vector<std::string> dataRoots(const Layout& layout, const std::string& variable) {
  std::vector<std::string> roots;
  const bool buildTree =
      !layout.libraryDirectory.empty() && layout.libraryDirectory == layout.buildLibraryDirectory;
  if (!layout.libraryDirectory.empty() && !buildTree)
    roots.push_back((layout.libraryDirectory / layout.libraryToData).lexically_normal().string());
  std::size_t start = 0;
  while (start <= variable.size()) {
    const std::size_t end = std::min(variable.find(':', start), variable.size());
    if (end > start)
      roots.push_back(variable.substr(start, end - start));
    start = end + 1;
  }
  if (buildTree)
    roots.insert(roots.end(), layout.buildRoots.begin(), layout.buildRoots.end());
  return roots;
}

}  // namespace detail

std::vector<std::string> dataRoots() {
  return detail::dataRoots(layout(), os::getenv("ZEFOKO_DATA_PATH"));
}

std::vector<std::string> dataDirectories(const std::string& application) {
  std::vector<std::string> out;
  if (!application.empty() && !isContained(application))
    return out;
  for (const auto& root : dataRoots()) {
    const fs::path dir = fs::path(root) / application;
    std::error_code ec;
    if (fs::is_directory(dir, ec))
      out.push_back(dir.lexically_normal().string());
  }
  return out;
}

std::string findData(const std::string& application, const std::string& relativePath) {
  if (!isContained(relativePath) || (!application.empty() && !isContained(application))) {
    KO_LOG_WARNING("ko.path") << "Refusing data lookup of '" << relativePath << "' for '"
                              << application << "': not a path inside the data directory";
    return {};
  }
  for (const auto& root : dataRoots()) {
    const fs::path candidate = fs::path(root) / application / relativePath;
    std::error_code ec;
    if (fs::exists(candidate, ec))
      return candidate.lexically_normal().string();
  }
  return {};
}

}  // namespace ko::path
