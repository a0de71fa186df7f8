#include "ko/path.hpp"

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "ko/log.hpp"
#include "ko/os.hpp"

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
}  // namespace

std::vector<std::string> dataRoots() {
  std::vector<std::string> roots;
  const std::string env = os::getenv("ZEFOKO_DATA_PATH");
  std::size_t start = 0;
  while (start <= env.size()) {
    const std::size_t end = std::min(env.find(':', start), env.size());
    if (end > start)
      roots.push_back(env.substr(start, end - start));
    start = end + 1;
  }
  roots.emplace_back(KO_GENERATED_SHARE_DIR);
  roots.emplace_back(KO_BUILD_SHARE_DIR);
  roots.emplace_back(KO_INSTALL_SHARE_DIR);
  return roots;
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
