#include "httpserver.h"

#include <httplib.h>

#include <algorithm>
#include <cctype>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <sstream>
#include <utility>
#include <vector>

#include "evalcall.h"
#include "ko/genericobject.hpp"
#include "ko/json.hpp"
#include "ko/log.hpp"
#include "ko/session.hpp"
#include "zefoko/viewer.h"
#include "zu/zuhtml.h"
#include "zu/zumodulecore.h"

namespace zefoko {

namespace {

constexpr const char* kCategory = "zefoko.http";
constexpr const char* kTokenCookie = "zefoko_token";
// The live page's angles, and the history a new live page starts with.
constexpr double kAngleSamplesPerSecond = 50;
constexpr std::int64_t kLiveHistoryUs = 30'000'000;
constexpr std::size_t kLiveHistoryEntries = 20'000;
// Each live stream holds one of the server's threads; the others stay for the pages.
constexpr int kMaxLiveStreams = 4;
constexpr auto kKeepAlive = std::chrono::seconds(10);
// How long a call's answer is waited for before the request answers that it runs.
constexpr int kCallAnswerMs = 1000;
constexpr int kServiceLookupMs = 2000;

const char* const kHtml = "text/html; charset=utf-8";
const char* const kJson = "application/json";

std::string dump(const nlohmann::json& value) {
  return value.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
}

void answer(httplib::Response& res, int status, const nlohmann::json& body) {
  res.status = status;
  res.set_content(dump(body), kJson);
}

// A path segment: every byte but the unreserved ones percent-encoded.
std::string encodeSegment(std::string_view text) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string out;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (std::isalnum(byte) || c == '-' || c == '_' || c == '.' || c == '~') {
      out += c;
    } else {
      out += '%';
      out += kHex[byte >> 4];
      out += kHex[byte & 0xf];
    }
  }
  return out;
}

// Compared in a time that does not tell how much of it matched.
bool sameSecret(std::string_view a, std::string_view b) {
  if (a.size() != b.size() || a.empty())
    return false;
  unsigned char differ = 0;
  for (std::size_t i = 0; i < a.size(); ++i)
    differ |= static_cast<unsigned char>(a[i] ^ b[i]);
  return differ == 0;
}

std::string cookieValue(const std::string& header, std::string_view name) {
  std::size_t at = 0;
  while (at < header.size()) {
    const std::size_t end = std::min(header.find(';', at), header.size());
    std::string_view part(header.data() + at, end - at);
    while (!part.empty() && part.front() == ' ')
      part.remove_prefix(1);
    if (part.size() > name.size() && part.substr(0, name.size()) == name &&
        part[name.size()] == '=')
      return std::string(part.substr(name.size() + 1));
    at = end + 1;
  }
  return {};
}

// The host named by a Host header, without its port.
std::string hostName(const std::string& header) {
  if (!header.empty() && header.front() == '[')
    return header.substr(0, header.find(']') + 1);
  return header.substr(0, header.find(':'));
}

// A report of the signal "actionReported" as the viewer's action entry, its times on the
// timeline's clock (ustime less `originUs`).
robotsim::TimelineEntry actionEntry(const ko::AnyValue& report, std::int64_t originUs,
                                    std::int64_t nowUs) {
  using Json = nlohmann::ordered_json;
  const Json r = ko::toJson(report);
  const auto time = [&](const char* key) -> Json {
    const std::int64_t us = r.value(key, std::int64_t{-1});
    return us < 0 ? Json() : Json(us - originUs);
  };
  std::string outcome = r.value("outcome", "executed");
  if (outcome == "dropped")
    outcome = "stopped";
  const Json end = time("endUs");
  robotsim::TimelineEntry entry;
  entry.us = end.is_null() ? nowUs : end.get<std::int64_t>();
  entry.service = "ZUMokuto";
  entry.operation = "action";
  // The text carries the error code in front of a skipped instruction.
  entry.arguments = ko::fromJsonValue(Json{{"bookmark", r.value("bookmark", 0)},
                                           {"type", ""},
                                           {"text", r.value("actionText", "")},
                                           {"error", nullptr},
                                           {"outcome", outcome},
                                           {"arrivedUs", time("bookmarkUs")},
                                           {"startUs", time("beginUs")},
                                           {"endUs", end}});
  return entry;
}

std::string indexPage(Host& host) {
  std::string page =
      "<!DOCTYPE html><html lang=\"en\"><head><meta charset=\"utf-8\"><title>zefoko</title>"
      "<link rel=\"icon\" href=\"data:,\"></head><body><h1>zefoko: the robot's modules</h1><ul>";
  for (const auto& name : host.broker()->session()->services()) {
    page += "<li><a href=\"/" + ZU::escapeHtml(encodeSegment(name)) + "/\">" +
            ZU::escapeHtml(name) + "</a></li>";
  }
  page +=
      "</ul><p><a href=\"/live/\">The robot, live</a> · <a href=\"/timeline\">its timeline "
      "(JSON lines)</a></p></body></html>";
  return page;
}

}  // namespace

// The recent timeline entries for the live streams, and the streams' wake-ups.
class HttpServer::Live {
 public:
  struct Entry {
    std::uint64_t serial = 0;
    std::int64_t us = 0;
    std::string json;
    nlohmann::json angles;  // of a "ZUMotion.angles" entry
  };

  void push(const robotsim::TimelineEntry& e) {
    Entry entry{0, e.us, dump(viewer::entryJson(e)), nullptr};
    if (e.service == "ZUMotion" && e.operation == "angles")
      entry.angles = ko::toJson(e.arguments);
    {
      std::lock_guard lock(fMutex);
      if (fClosed)
        return;
      entry.serial = ++fSerial;
      fEntries.push_back(std::move(entry));
      while (!fEntries.empty() && (fEntries.size() > kLiveHistoryEntries ||
                                   fEntries.front().us < fEntries.back().us - kLiveHistoryUs)) {
        // The angles that leave the history stay in the pose it starts from.
        if (fEntries.front().angles.is_object()) {
          for (const auto& [joint, angle] : fEntries.front().angles.items())
            fPose[joint] = angle;
        }
        fEntries.pop_front();
      }
    }
    fChanged.notify_all();
  }

  // The first event of a stream: the joints, the clock and the history, the pose it
  // starts from first; `serial` receives the last entry it holds.
  std::string hello(std::int64_t nowUs, std::uint64_t& serial) {
    std::lock_guard lock(fMutex);
    std::string entries;
    if (!fPose.empty()) {
      const std::int64_t from = fEntries.empty() ? nowUs : fEntries.front().us;
      entries = dump({{"us", from},
                      {"service", "ZUMotion"},
                      {"operation", "angles"},
                      {"arguments", nlohmann::json(fPose)}});
    }
    for (const auto& e : fEntries)
      entries += (entries.empty() ? "" : ",") + e.json;
    serial = fSerial;
    return "{\"joints\":" + dump(viewer::jointsJson()) + ",\"sampleUs\":" +
           std::to_string(static_cast<std::int64_t>(1e6 / kAngleSamplesPerSecond)) +
           ",\"nowUs\":" + std::to_string(nowUs) + ",\"entries\":[" + entries + "]}";
  }

  // The entries after `serial`, waiting at most `wait` for one; false once closed.
  bool next(std::uint64_t& serial, std::vector<std::string>& out,
            std::chrono::steady_clock::duration wait) {
    std::unique_lock lock(fMutex);
    fChanged.wait_for(lock, wait, [&] { return fClosed || fSerial > serial; });
    if (fClosed)
      return false;
    for (const auto& e : fEntries) {
      if (e.serial > serial)
        out.push_back(e.json);
    }
    serial = fSerial;
    return true;
  }

  bool enter() {
    std::lock_guard lock(fMutex);
    if (fClosed || fStreams >= kMaxLiveStreams)
      return false;
    ++fStreams;
    return true;
  }
  void leave() {
    std::lock_guard lock(fMutex);
    --fStreams;
  }

  void close() {
    {
      std::lock_guard lock(fMutex);
      fClosed = true;
    }
    fChanged.notify_all();
  }

 private:
  std::mutex fMutex;
  std::condition_variable fChanged;
  std::deque<Entry> fEntries;
  std::map<std::string, nlohmann::json> fPose;
  std::uint64_t fSerial = 0;
  int fStreams = 0;
  bool fClosed = false;
};

bool isLoopbackAddress(std::string_view address) {
  return address == "localhost" || address == "::1" || address == "[::1]" ||
         address.substr(0, 4) == "127.";
}

HttpOptions parseHttpAddress(std::string_view text) {
  const std::size_t colon = text.rfind(':');
  if (colon == std::string_view::npos || colon == 0 || colon + 1 == text.size())
    throw HttpError("expected ADDRESS:PORT, not \"" + std::string(text) + "\"");
  HttpOptions options;
  options.address = std::string(text.substr(0, colon));
  if (options.address.front() == '[') {
    if (options.address.back() != ']')
      throw HttpError("expected [IPv6]:PORT, not \"" + std::string(text) + "\"");
    options.address = options.address.substr(1, options.address.size() - 2);
  }
  const std::string_view port = text.substr(colon + 1);
  int value = 0;
  for (const char c : port) {
    if (c < '0' || c > '9' || value > 65535)
      throw HttpError("the port must be a number from 0 to 65535, not \"" + std::string(port) +
                      "\"");
    value = value * 10 + (c - '0');
  }
  if (value > 65535)
    throw HttpError("the port must be a number from 0 to 65535, not \"" + std::string(port) + "\"");
  options.port = value;
  return options;
}

HttpServer::HttpServer(Host& host, HttpOptions options)
    : fHost(host),
      fOptions(std::move(options)),
      fLive(std::make_shared<Live>()),
      fServer(std::make_unique<httplib::Server>()) {
  const bool loopback = isLoopbackAddress(fOptions.address);
  if (!loopback && fOptions.token.empty()) {
    throw HttpError("the address " + fOptions.address +
                    " is beyond loopback: give a token with --http-token");
  }
  httplib::Server& server = *fServer;

  server.set_pre_routing_handler(
      [this, loopback](const httplib::Request& req, httplib::Response& res) {
        using Handled = httplib::Server::HandlerResponse;
        if (loopback && fOptions.token.empty() &&
            !isLoopbackAddress(hostName(req.get_header_value("Host")))) {
          answer(res, 403, {{"error", "this server answers loopback host names only"}});
          return Handled::Handled;
        }
        if (fOptions.token.empty())
          return Handled::Unhandled;
        const std::string bearer = req.get_header_value("Authorization");
        if ((bearer.rfind("Bearer ", 0) == 0 && sameSecret(bearer.substr(7), fOptions.token)) ||
            sameSecret(cookieValue(req.get_header_value("Cookie"), kTokenCookie), fOptions.token))
          return Handled::Unhandled;
        if (req.has_param("token") && sameSecret(req.get_param_value("token"), fOptions.token)) {
          res.set_header("Set-Cookie", std::string(kTokenCookie) + "=" + fOptions.token +
                                           "; Path=/; HttpOnly; SameSite=Strict");
          return Handled::Unhandled;
        }
        answer(res, 401, {{"error", "this server needs its token (?token=, or a Bearer header)"}});
        return Handled::Handled;
      });

  server.Get("/", [this](const httplib::Request&, httplib::Response& res) {
    res.set_content(indexPage(fHost), kHtml);
  });
  server.Get("/timeline", [this](const httplib::Request&, httplib::Response& res) {
    std::ostringstream lines;
    fHost.robot().timeline()->writeJsonLines(lines);
    res.set_content(lines.str(), "application/x-ndjson; charset=utf-8");
  });
  // Pages without an icon of their own (the modules') make the browser ask for one.
  server.Get("/favicon.ico",
             [](const httplib::Request&, httplib::Response& res) { res.status = 204; });
  server.Get("/live",
             [](const httplib::Request&, httplib::Response& res) { res.set_redirect("/live/"); });
  server.Get("/live/", [](const httplib::Request&, httplib::Response& res) {
    res.set_content(viewer::livePage("zefoko: the robot, live"), kHtml);
  });
  server.Get("/live/events", [this](const httplib::Request&, httplib::Response& res) {
    const std::shared_ptr<Live> live = fLive;
    if (!live->enter()) {
      answer(res, 503, {{"error", "too many live pages are open"}});
      return;
    }
    auto serial = std::make_shared<std::uint64_t>(0);
    auto hello = std::make_shared<std::string>(
        "event: hello\ndata: " + live->hello(fHost.robot().timeline()->now(), *serial) + "\n\n");
    res.set_header("Cache-Control", "no-store");
    res.set_chunked_content_provider(
        "text/event-stream",
        [live, serial, hello](std::size_t, httplib::DataSink& sink) {
          if (!hello->empty()) {
            const std::string first = std::move(*hello);
            hello->clear();
            return sink.write(first.data(), first.size());
          }
          std::vector<std::string> entries;
          if (!live->next(*serial, entries, kKeepAlive)) {
            sink.done();
            return true;
          }
          std::string chunk = entries.empty() ? ": still here\n\n" : "";
          for (const auto& entry : entries)
            chunk += "event: entry\ndata: " + entry + "\n\n";
          return sink.write(chunk.data(), chunk.size());
        },
        [live](bool) { live->leave(); });
  });
  server.Get(R"(/([^/]+))", [](const httplib::Request& req, httplib::Response& res) {
    res.set_redirect("/" + encodeSegment(req.matches[1].str()) + "/");
  });
  server.Get(R"(/([^/]+)/)", [this](const httplib::Request& req, httplib::Response& res) {
    const std::string name = req.matches[1].str();
    if (req.has_param("eval")) {
      xEval(req, res);
      return;
    }
    const auto module = fHost.broker()->getModuleByName(name);
    if (!module) {
      res.status = 404;
      res.set_content("<!DOCTYPE html><html><body><p>No module " + ZU::escapeHtml(name) +
                          " in this process.</p><p><a href=\"/\">The modules</a></p></body></html>",
                      kHtml);
      return;
    }
    res.set_content(module->httpGet(), kHtml);
  });

  fPort = fOptions.port == 0
              ? server.bind_to_any_port(fOptions.address)
              : (server.bind_to_port(fOptions.address, fOptions.port) ? fOptions.port : -1);
  if (fPort <= 0) {
    throw HttpError("cannot listen on " + fOptions.address + ":" + std::to_string(fOptions.port));
  }
  // The live page draws the joints that move, from the pose it starts from.
  host.robot().timeline()->addListener([weak = std::weak_ptr<Live>(fLive)](const auto& entry) {
    if (const auto live = weak.lock())
      live->push(entry);
  });
  const auto modules = host.moduleNames();
  if (std::find(modules.begin(), modules.end(), "ZUMokuto") != modules.end()) {
    try {
      fReporter = host.broker()->session()->service("ZUMokuto").value(kServiceLookupMs);
    } catch (const std::exception& e) {
      KO_LOG_WARNING(kCategory) << "The live page shows no actions: " << e.what();
    }
  }
  if (fReporter) {
    fReports = fReporter->connect(
        "actionReported", [weak = std::weak_ptr<Live>(fLive),
                           timeline = host.robot().timeline()](ko::AnyValue report) {
          if (const auto live = weak.lock())
            live->push(actionEntry(report, timeline->originUs(), timeline->now()));
        });
  }
  host.robot().motion()->sampleAngles(kAngleSamplesPerSecond);
  host.robot().motion()->recordPose();
  fThread = std::thread([this] { fServer->listen_after_bind(); });
  KO_LOG_INFO(kCategory) << "Serving " << url();
}

HttpServer::~HttpServer() {
  stop();
}

std::string HttpServer::url() const {
  const bool v6 = fOptions.address.find(':') != std::string::npos;
  return "http://" + (v6 ? "[" + fOptions.address + "]" : fOptions.address) + ":" +
         std::to_string(fPort) + "/";
}

void HttpServer::stop() {
  fLive->close();
  if (fReporter) {
    try {
      fReporter->disconnect(fReports);
    } catch (const std::exception& e) {
      KO_LOG_WARNING(kCategory) << "The action reports stay linked: " << e.what();
    }
    fReporter.reset();
  }
  if (fThread.joinable()) {
    fServer->stop();
    fThread.join();
    fHost.robot().motion()->sampleAngles(0);
  }
}

void HttpServer::xEval(const httplib::Request& req, httplib::Response& res) {
  if (req.get_header_value("Sec-Fetch-Site") == "cross-site") {
    answer(res, 403, {{"error", "calls are not taken from another site's pages"}});
    return;
  }
  const std::string text = req.get_param_value("eval");
  EvalCall call;
  try {
    call = parseEvalCall(text);
  } catch (const EvalSyntaxError& e) {
    answer(res, 400,
           {{"error", std::string("not a call of the form Module.method('text', 12, "
                                  "0.5, ...): ") +
                          e.what()}});
    return;
  }
  ko::AnyObject object;
  try {
    object = fHost.broker()->session()->service(call.module).value(kServiceLookupMs);
  } catch (const std::exception&) {
  }
  if (!object) {
    answer(res, 400, {{"error", "no service " + call.module}});
    return;
  }
  unsigned method = 0;
  try {
    method = object->resolveMethod(call.method, call.arguments);
  } catch (const std::exception& e) {
    answer(res, 400, {{"error", e.what()}});
    return;
  }
  KO_LOG_INFO(kCategory) << "Call from the page " << req.path << ": " << text;
  const ko::Future<ko::AnyValue> result = object->asyncById(method, call.arguments);
  switch (result.wait(kCallAnswerMs)) {
    case ko::FutureState::FinishedWithValue:
      answer(res, 200, {{"result", ko::toJson(result.value())}});
      break;
    case ko::FutureState::Running:
    case ko::FutureState::Timeout:
      answer(res, 202, {{"running", true}});
      break;
    default:
      answer(res, 500, {{"error", result.error(0)}});
      break;
  }
}

}  // namespace zefoko

namespace zefoko {

CLI::Option* addHttpOptions(CLI::App& command, HttpCommandOptions& options) {
  CLI::Option* http =
      command
          .add_option("--http", options.address,
                      "Serve the modules' pages, their calls and the live page of the robot over "
                      "HTTP at ADDRESS:PORT (port 0: any free one); loopback unless a token is "
                      "given (default: none)")
          ->type_name("ADDRESS:PORT");
  command
      .add_option("--http-token", options.token,
                  "The token that every HTTP request must carry (?token= once, then a cookie)")
      ->type_name("TOKEN")
      ->needs(http);
  return http;
}

std::unique_ptr<HttpServer> startHttpServer(Host& host, const HttpCommandOptions& options,
                                            std::ostream& out) {
  if (options.address.empty())
    return nullptr;
  HttpOptions http = parseHttpAddress(options.address);
  http.token = options.token;
  auto server = std::make_unique<HttpServer>(host, http);
  out << "zefoko: pages at " << server->url() << std::endl;
  return server;
}

}  // namespace zefoko
