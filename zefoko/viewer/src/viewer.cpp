#include "zefoko/viewer.h"

#include <boost/archive/iterators/base64_from_binary.hpp>
#include <boost/archive/iterators/transform_width.hpp>

#include <initializer_list>
#include <utility>

#include "ko/json.hpp"
#include "robotsim/jointmodel.h"
#include "zu/zuhtml.h"

namespace zefoko::viewer {

// The page sources, built in (see CMakeLists.txt).
extern const std::string_view kViewerHtml;
extern const std::string_view kLiveHtml;
extern const std::string_view kViewerCss;
extern const std::string_view kViewerJs;

namespace {

// The template with each "{{NAME}}" replaced by its text; the texts are not searched.
std::string fill(std::string_view page,
                 std::initializer_list<std::pair<std::string_view, std::string_view>> texts) {
  std::string out;
  out.reserve(page.size());
  for (std::size_t at = 0;;) {
    const std::size_t open = page.find("{{", at);
    const std::size_t close = open == std::string_view::npos ? open : page.find("}}", open);
    if (close == std::string_view::npos) {
      out.append(page.substr(at));
      return out;
    }
    out.append(page.substr(at, open - at));
    const std::string_view name = page.substr(open + 2, close - open - 2);
    for (const auto& [key, text] : texts) {
      if (key == name)
        out.append(text);
    }
    at = close + 2;
  }
}

std::string base64(const std::string& bytes) {
  using namespace boost::archive::iterators;
  using Encoder = base64_from_binary<transform_width<std::string::const_iterator, 6, 8>>;
  std::string out(Encoder(bytes.begin()), Encoder(bytes.end()));
  out.append((3 - bytes.size() % 3) % 3, '=');
  return out;
}

// JSON inside a <script> element: no "<" that could close it.
std::string scriptJson(const nlohmann::json& value) {
  const std::string json = value.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
  std::string out;
  out.reserve(json.size());
  for (const char c : json) {
    if (c == '<')
      out += "\\u003c";
    else
      out += c;
  }
  return out;
}

}  // namespace

nlohmann::json entryJson(const robotsim::TimelineEntry& e) {
  nlohmann::json j;
  j["us"] = e.us;
  j["service"] = e.service;
  j["operation"] = e.operation;
  j["arguments"] = ko::toJson(e.arguments);
  if (!e.result.isVoid())
    j["result"] = ko::toJson(e.result);
  return j;
}

nlohmann::json jointsJson() {
  nlohmann::json joints = nlohmann::json::array();
  for (const auto& joint : robotsim::bodyJoints()) {
    joints.push_back({{"name", joint.name},
                      {"min", joint.minAngle},
                      {"max", joint.maxAngle},
                      {"rest", joint.restAngle}});
  }
  return joints;
}

std::string performancePage(const RecordedPerformance& p) {
  nlohmann::json data;
  data["originUs"] = p.originUs;
  data["endUs"] = p.endUs;
  data["sampleUs"] = p.sampleUs;
  data["summary"] = p.summary;
  data["joints"] = jointsJson();
  data["entries"] = p.entries;
  const std::string title = ZU::escapeHtml(p.title);
  const std::string text = ZU::escapeHtml(p.text);
  const std::string json = scriptJson(data);
  const std::string audio = base64(p.wav);
  return fill(kViewerHtml, {{"TITLE", title},
                            {"TEXT", text},
                            {"STYLE", kViewerCss},
                            {"AUDIO", audio},
                            {"DATA", json},
                            {"SCRIPT", kViewerJs}});
}

std::string livePage(std::string_view title) {
  const std::string escaped = ZU::escapeHtml(title);
  return fill(kLiveHtml, {{"TITLE", escaped}, {"STYLE", kViewerCss}, {"SCRIPT", kViewerJs}});
}

}  // namespace zefoko::viewer
