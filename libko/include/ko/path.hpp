#pragma once
// Where the framework finds its data files.
//
// The data roots are searched in order: every directory of the environment variable
// ZEFOKO_DATA_PATH (colon-separated, read at each call), then the build's share/, then
// the installation's share/. Thread-safe.

#include <string>
#include <vector>

namespace ko::path {

// The data roots, in search order (whether they exist or not).
std::vector<std::string> dataRoots();
// <root>/<application> for every root where that directory exists, in search order.
std::vector<std::string> dataDirectories(const std::string& application);
// The first existing <root>/<application>/<relativePath>, or "" when there is none (or
// when `relativePath` is empty, absolute or leaves the application's directory).
std::string findData(const std::string& application, const std::string& relativePath);

}  // namespace ko::path
