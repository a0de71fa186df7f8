#include "ko/remote.hpp"

#include <sys/stat.h>
#include <zmq.h>

#include <algorithm>
#include <cctype>
#include <chrono>
#include <fstream>
#include <set>
#include <sstream>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"
#include "remote_node.hpp"

namespace ko {

namespace remote {

namespace {
constexpr std::size_t kZ85KeyLength = 40;

std::string trim(std::string s) {
  const auto notSpace = [](unsigned char c) { return !std::isspace(c); };
  s.erase(s.begin(), std::find_if(s.begin(), s.end(), notSpace));
  s.erase(std::find_if(s.rbegin(), s.rend(), notSpace).base(), s.end());
  return s;
}
}  // namespace

bool isLocalEndpoint(const std::string& endpoint) {
  if (endpoint.rfind("ipc://", 0) == 0 || endpoint.rfind("inproc://", 0) == 0)
    return true;
  if (endpoint.rfind("tcp://", 0) != 0)
    return false;
  std::string host = endpoint.substr(6);
  // tcp://[::1]:5555, tcp://127.0.0.1:5555; a source address ("tcp://a;b:5555") counts
  // by its destination.
  if (const auto semicolon = host.find(';'); semicolon != std::string::npos)
    host = host.substr(semicolon + 1);
  if (!host.empty() && host.front() == '[') {
    const auto close = host.find(']');
    host = close == std::string::npos ? host : host.substr(1, close - 1);
  } else if (const auto colon = host.rfind(':'); colon != std::string::npos) {
    host = host.substr(0, colon);
  }
  if (host == "localhost" || host == "::1")
    return true;
  return host.rfind("127.", 0) == 0 && host.find_first_not_of("0123456789.") == std::string::npos;
}

std::string missingKeys(const std::string& endpoint, bool listening, const CurveKeys& keys) {
  if (isLocalEndpoint(endpoint))
    return {};
  if (listening && (keys.secretKey.empty() || keys.clientKeys.empty()))
    return "Listening on " + endpoint +
           " opens the service to the network: it needs CURVE keys (this process's secret key "
           "and the public keys of the processes allowed to connect; make pairs with `zefoko "
           "keys DIR`), or a loopback or ipc:// endpoint";
  if (!listening && (keys.secretKey.empty() || keys.serverKey.empty()))
    return "Connecting to " + endpoint +
           " goes through the network: it needs CURVE keys (the listening process's public key "
           "and a secret key of this process's own)";
  return {};
}

KeyPair makeKeyPair() {
  char publicKey[kZ85KeyLength + 1] = {};
  char secretKey[kZ85KeyLength + 1] = {};
  if (zmq_curve_keypair(publicKey, secretKey) != 0)
    throw Error(std::string("Cannot make a CURVE key pair: ") + zmq_strerror(zmq_errno()));
  return {publicKey, secretKey};
}

std::string publicKeyOf(const std::string& secretKey) {
  char publicKey[kZ85KeyLength + 1] = {};
  if (secretKey.size() != kZ85KeyLength || zmq_curve_public(publicKey, secretKey.c_str()) != 0)
    throw Error("Not a CURVE secret key (40 characters of Z85 text)");
  return publicKey;
}

std::string readKeyFile(const std::string& path) {
  std::ifstream in(path);
  if (!in)
    throw Error("Cannot read the key file " + path);
  std::string line;
  while (std::getline(in, line)) {
    line = trim(line);
    if (line.empty() || line.front() == '#')
      continue;
    if (line.size() != kZ85KeyLength)
      throw Error("The key file " + path + " holds no key (40 characters of Z85 text)");
    return line;
  }
  throw Error("The key file " + path + " holds no key");
}

void writeKeyFile(const std::string& path, const std::string& key, bool secret) {
  const mode_t previous = secret ? ::umask(0077) : ::umask(0022);
  std::ofstream out(path, std::ios::trunc);
  ::umask(previous);
  if (!out)
    throw Error("Cannot write the key file " + path);
  out << (secret ? "# CURVE secret key: keep it to this machine\n" : "# CURVE public key\n") << key
      << '\n';
  if (!out.flush())
    throw Error("Cannot write the key file " + path);
  if (secret)
    ::chmod(path.c_str(), 0600);
}

}  // namespace remote

namespace detail {

// ---- ServingPool -----------------------------------------------------------------------

// A job that finds no idle thread gets a new one at once while the pool has fewer than
// kCoreThreads; beyond, the supervisor adds a thread whenever the oldest job has waited
// kStall: cheap calls in numbers share a few threads, and a call that blocks never keeps the
// next from running for more than kStall.
constexpr std::size_t kCoreThreads = 8;
constexpr auto kStall = std::chrono::milliseconds(2);

struct ServingPool::State {
  struct Job {
    std::function<void()> run;
    std::chrono::steady_clock::time_point queued;
  };
  std::string name;
  std::size_t maxThreads = 1;
  std::mutex mutex;
  std::condition_variable wake;
  std::condition_variable supervise;
  std::deque<Job> jobs;
  std::vector<std::thread> threads;
  std::thread supervisor;
  std::size_t idle = 0;
  bool stopping = false;
  bool warnedFull = false;
};

namespace {
void servingThread(const std::shared_ptr<ServingPool::State>& s) {
  FrameworkThreadScope scope;
  // Calls and events from other processes run here, as the memory service's deliveries run
  // on its real-time threads in one process.
  const os::RealtimeScope realtime;
  std::unique_lock lock(s->mutex);
  for (;;) {
    ++s->idle;
    s->wake.wait(lock, [&] { return s->stopping || !s->jobs.empty(); });
    --s->idle;
    if (s->stopping)
      return;
    std::function<void()> job = std::move(s->jobs.front().run);
    s->jobs.pop_front();
    lock.unlock();
    try {
      job();
    } catch (const std::exception& e) {
      KO_LOG_ERROR("ko.remote") << s->name << ": a job threw: " << e.what();
    } catch (...) {
      KO_LOG_ERROR("ko.remote") << s->name << ": a job threw an unknown exception";
    }
    job = nullptr;  // what it holds goes outside the lock
    lock.lock();
  }
}

// With the state's mutex held.
void addThread(const std::shared_ptr<ServingPool::State>& s) {
  if (s->threads.size() < s->maxThreads) {
    s->threads.emplace_back([s] { servingThread(s); });
  } else if (!s->warnedFull) {
    s->warnedFull = true;
    KO_LOG_WARNING("ko.remote") << s->name << ": all " << s->maxThreads
                                << " serving threads are busy; calls wait for one";
  }
}

void supervisorThread(const std::shared_ptr<ServingPool::State>& s) {
  std::unique_lock lock(s->mutex);
  while (!s->stopping) {
    if (s->jobs.size() <= s->idle) {
      s->supervise.wait(lock);
      continue;
    }
    const auto due = s->jobs.front().queued + kStall;
    if (std::chrono::steady_clock::now() >= due) {
      addThread(s);
      s->wake.notify_one();
      s->supervise.wait_for(lock, kStall);  // the new thread takes the job meanwhile
    } else {
      s->supervise.wait_until(lock, due);
    }
  }
}
}  // namespace

ServingPool::ServingPool(std::string name, std::size_t maxThreads)
    : state_(std::make_shared<State>()) {
  state_->name = std::move(name);
  state_->maxThreads = std::max<std::size_t>(1, maxThreads);
}

ServingPool::~ServingPool() {
  stop();
}

void ServingPool::post(std::function<void()> job) {
  std::lock_guard lock(state_->mutex);
  if (state_->stopping)
    return;
  state_->jobs.push_back({std::move(job), std::chrono::steady_clock::now()});
  if (state_->jobs.size() > state_->idle) {
    if (state_->threads.size() < std::min(kCoreThreads, state_->maxThreads)) {
      addThread(state_);
    } else {
      if (!state_->supervisor.joinable())
        state_->supervisor = std::thread([s = state_] { supervisorThread(s); });
      state_->supervise.notify_one();
    }
  }
  state_->wake.notify_one();
}

void ServingPool::stop() {
  std::vector<std::thread> threads;
  std::deque<State::Job> dropped;
  std::thread supervisor;
  {
    std::lock_guard lock(state_->mutex);
    state_->stopping = true;
    dropped.swap(state_->jobs);
    threads.swap(state_->threads);
    supervisor = std::move(state_->supervisor);
  }
  state_->wake.notify_all();
  state_->supervise.notify_all();
  dropped.clear();
  if (supervisor.joinable())
    supervisor.join();
  for (auto& t : threads) {
    if (t.get_id() == std::this_thread::get_id())
      t.detach();  // this job's thread leaves once the job returns
    else
      t.join();
  }
}

// ---- SerialQueue -----------------------------------------------------------------------

void SerialQueue::post(std::function<void()> job) {
  {
    std::lock_guard lock(mutex_);
    jobs_.push_back(std::move(job));
    if (draining_)
      return;
    draining_ = true;
  }
  pool_->post([self = shared_from_this()] { self->drain(); });
}

void SerialQueue::drain() {
  for (;;) {
    std::function<void()> job;
    {
      std::lock_guard lock(mutex_);
      if (jobs_.empty()) {
        draining_ = false;
        return;
      }
      job = std::move(jobs_.front());
      jobs_.pop_front();
    }
    try {
      job();
    } catch (const std::exception& e) {
      KO_LOG_ERROR("ko.remote") << "A delivery threw: " << e.what();
    }
  }
}

}  // namespace detail
}  // namespace ko
