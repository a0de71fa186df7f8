#pragma once
// The host's pages over HTTP: an index of the modules, each module's page (its httpGet)
// at /<Module>/ with the calls that the page asks for ("?eval=", see evalcall.h), the
// robot's timeline as JSON lines at /timeline, and the live page of the robot at /live/,
// which follows the timeline through server-sent events (/live/events), with the actions
// that the service ZUMokuto of the process reports (its signal "actionReported").
//
// It listens on loopback addresses only, unless it has a token: then every request must
// carry it (an "Authorization: Bearer" header, a "zefoko_token" cookie, or "?token=" once,
// which sets the cookie). Requests on loopback must name a loopback host (no page of
// another site reaches it through a name of its own), and calls that another site's page
// asks for are refused.
//
// Built and stopped by one thread; requests are served on the server's own threads; the
// timeline's listener runs in the threads that record, the reports of actions in the
// threads that say the texts. The live streams share one queue of recent entries under its
// own mutex.

#include <memory>
#include <ostream>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>

#include <CLI/CLI.hpp>

#include "ko/anyvalue.hpp"
#include "ko/signal.hpp"
#include "zefoko/host.h"

namespace httplib {
class Server;
struct Request;
struct Response;
}  // namespace httplib

namespace zefoko {

class HttpError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct HttpOptions {
  std::string address = "127.0.0.1";
  int port = 0;  // 0: any free port
  std::string token;
};

// "ADDRESS:PORT" ("127.0.0.1:8080", "[::1]:0", "localhost:8080", "0.0.0.0:8080"); raises
// HttpError for anything else.
HttpOptions parseHttpAddress(std::string_view text);
bool isLoopbackAddress(std::string_view address);

class HttpServer {
 public:
  // Listens at once; raises HttpError when it cannot, or for an address beyond loopback
  // without a token. `host` must outlive the server.
  HttpServer(Host& host, HttpOptions options);
  // As stop().
  ~HttpServer();
  HttpServer(const HttpServer&) = delete;
  HttpServer& operator=(const HttpServer&) = delete;

  // "http://127.0.0.1:PORT/".
  std::string url() const;
  // Ends the live streams and the server, waiting for its threads. Idempotent.
  void stop();

  class Live;

 private:
  // A page's call: parsed, looked up, run on its service.
  void xEval(const httplib::Request& req, httplib::Response& res);

  Host& fHost;
  const HttpOptions fOptions;
  int fPort = 0;
  std::shared_ptr<Live> fLive;
  // The service whose action reports the live page shows (null without one), and the link.
  ko::AnyObject fReporter;
  ko::SignalLink fReports = 0;
  std::unique_ptr<httplib::Server> fServer;
  std::thread fThread;
};

// What a command that serves the pages is told: --http ADDRESS:PORT, --http-token TOKEN.
struct HttpCommandOptions {
  std::string address;  // empty: no server
  std::string token;
};
// Answers the --http option.
CLI::Option* addHttpOptions(CLI::App& command, HttpCommandOptions& options);
// The server those options ask for, its address told on `out`; null when they ask for
// none. Raises HttpError.
std::unique_ptr<HttpServer> startHttpServer(Host& host, const HttpCommandOptions& options,
                                            std::ostream& out);

}  // namespace zefoko
