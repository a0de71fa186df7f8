#include "ko/remote.hpp"

#include <sys/stat.h>
#include <zmq.h>

#include <algorithm>
#include <cctype>
#include <fstream>
#include <set>
#include <sstream>

#include "ko/log.hpp"
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
  out << (secret ? "# CURVE secret key: keep it to this machine\n" : "# CURVE public key\n")
      << key << '\n';
  if (!out.flush())
    throw Error("Cannot write the key file " + path);
  if (secret)
    ::chmod(path.c_str(), 0600);
}

}  // namespace remote

namespace detail {

// ---- ServingPool -----------------------------------------------------------------------

struct ServingPool::State {
  std::string name;
  std::size_t maxThreads = 1;
  std::mutex mutex;
  std::condition_variable wake;
  std::deque<std::function<void()>> jobs;
  std::vector<std::thread> threads;
  std::size_t idle = 0;
  bool stopping = false;
  bool warnedFull = false;
};

namespace {
void servingThread(const std::shared_ptr<ServingPool::State>& s) {
  FrameworkThreadScope scope;
  std::unique_lock lock(s->mutex);
  for (;;) {
    ++s->idle;
    s->wake.wait(lock, [&] { return s->stopping || !s->jobs.empty(); });
    --s->idle;
    if (s->stopping)
      return;
    std::function<void()> job = std::move(s->jobs.front());
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
  state_->jobs.push_back(std::move(job));
  // Every job waiting beyond the idle threads gets a thread of its own: a job that blocks
  // never keeps the next from running.
  if (state_->jobs.size() > state_->idle) {
    if (state_->threads.size() < state_->maxThreads) {
      state_->threads.emplace_back([s = state_] { servingThread(s); });
    } else if (!state_->warnedFull) {
      state_->warnedFull = true;
      KO_LOG_WARNING("ko.remote") << state_->name << ": all " << state_->maxThreads
                                  << " serving threads are busy; calls wait for one";
    }
  }
  state_->wake.notify_one();
}

void ServingPool::stop() {
  std::vector<std::thread> threads;
  std::deque<std::function<void()>> dropped;
  {
    std::lock_guard lock(state_->mutex);
    state_->stopping = true;
    dropped.swap(state_->jobs);
    threads.swap(state_->threads);
  }
  state_->wake.notify_all();
  dropped.clear();
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
