#pragma once
// Sessions across processes: the options of a session that listens on an endpoint or
// connects to one (ko::Session::listen, ko::Session::connect), and the CURVE keys that
// secure a link. The protocol is described in docs/protocol.md.
//
// Plain values and pure functions: any thread.

#include <chrono>
#include <cstddef>
#include <string>
#include <vector>

#include "ko/error.hpp"

namespace ko {

// The CURVE keys of a link, each as 40 characters of Z85 text.
struct CurveKeys {
  // This process's own secret key; its public key is derived from it.
  std::string secretKey;
  // Connecting: the public key of the listening process.
  std::string serverKey;
  // Listening: the public keys of the processes allowed to connect.
  std::vector<std::string> clientKeys;

  bool empty() const { return secretKey.empty(); }
};

struct RemoteOptions {
  // How this process is named in the directory and in other processes' messages;
  // empty: "<program> (pid <pid>)".
  std::string processName;
  // A ping goes to each linked process every interval; a process silent for the time-out
  // is taken for dead.
  std::chrono::milliseconds heartbeatInterval{500};
  std::chrono::milliseconds heartbeatTimeout{2500};
  // The largest message sent or accepted (all frames together); a larger one is refused
  // with an error reply.
  std::size_t maxMessageBytes = std::size_t{16} << 20;
  // A call to a service of another process that has not answered within this time ends
  // with an error; 0: calls wait for their answer or for the end of the process that
  // serves them.
  std::chrono::milliseconds callTimeout{0};
  // How long registering a service, looking one up or listing the directory waits for
  // the listening process.
  std::chrono::milliseconds requestTimeout{10000};
  // Threads that serve the calls and signals of other processes, at most. They are started
  // as calls come: a few at once, then one more whenever a call has waited 2 ms for a
  // thread, so that a call that blocks (a say, a blocking bookmark) never holds up the next
  // for longer, as a call made in the process runs in its caller's thread.
  std::size_t maxServingThreads = 256;
  CurveKeys curve;
};

namespace remote {

// Whether the endpoint is reached without a network: ipc://, inproc://, or tcp:// on a
// loopback address (127.x.x.x, ::1, localhost).
bool isLocalEndpoint(const std::string& endpoint);

// Why a process may not listen on (`listening`) or connect to `endpoint` with `keys`: an
// endpoint reached through the network needs CURVE keys. Empty when it may.
std::string missingKeys(const std::string& endpoint, bool listening, const CurveKeys& keys);

struct KeyPair {
  std::string publicKey;
  std::string secretKey;
};
// A new CURVE key pair; raises ko::Error when ZeroMQ has no CURVE.
KeyPair makeKeyPair();
// The public key of a secret key; raises ko::Error for a malformed key.
std::string publicKeyOf(const std::string& secretKey);
// The key in a file written by writeKeyFile (or any file holding the 40 Z85 characters,
// with comment lines starting with '#'); raises ko::Error when there is none.
std::string readKeyFile(const std::string& path);
// Writes `key` to `path` with a comment line; a secret key's file is readable by its
// owner only. Raises ko::Error when it cannot.
void writeKeyFile(const std::string& path, const std::string& key, bool secret);

}  // namespace remote
}  // namespace ko
