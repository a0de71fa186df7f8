#pragma once
// Text put into the HTML pages that modules serve (httpGet) and that the host serves
// around them. Pure functions: any thread.

#include <string>
#include <string_view>

namespace ZU {

// The text with & < > " ' escaped, for an element's content or a quoted attribute.
std::string escapeHtml(std::string_view text);

}  // namespace ZU
