#pragma once
// Where services die.
//
// A service's destructor stops and joins the threads that serve it. Run on one of those
// threads it would wait for itself, and the code that dropped the last reference would go
// on in freed memory. Yet any framework thread may hold a service for a while: a call
// through a weak handle keeps its object alive until it returns, a posted call keeps its
// module alive until it ends. So the framework keeps destructions off its own threads: an
// object made with ko::makeShared (services, modules, brokers) whose last reference is
// dropped on a framework thread is destroyed on the reaper, a thread of the process that
// does nothing else. Dropped anywhere else, it is destroyed at once in the dropping thread.
//
// Framework threads are the threads of every ko::EventLoop (periodic tasks run there) and
// the workers that mark themselves with FrameworkThreadScope. The reaper itself is none.
//
// Thread-safe. The reaper starts with the first framework thread and, at the end of the
// process, destroys whatever it still holds before it stops; a destruction handed over
// after that (a framework thread still running while the process's statics go) runs in
// the dropping thread.

#include <functional>
#include <memory>
#include <utility>

namespace ko {

// Whether the calling thread is a framework thread.
bool isFrameworkThread() noexcept;

// Marks the calling thread as a framework thread for the life of the scope.
class FrameworkThreadScope {
 public:
  FrameworkThreadScope() noexcept;
  ~FrameworkThreadScope();
  FrameworkThreadScope(const FrameworkThreadScope&) = delete;
  FrameworkThreadScope& operator=(const FrameworkThreadScope&) = delete;
};

// Runs `destroy` on the reaper thread, in the order handed over.
void reap(std::function<void()> destroy);
// Waits until every destruction handed to the reaper before the call has run. Must not be
// called from a destructor that the reaper runs, nor from a framework thread (one of those
// destructions may be stopping the loop that runs the caller).
void waitForReaper();

// The deleter of ko::makeShared.
template <class T>
struct ReapingDelete {
  void operator()(T* object) const {
    if (isFrameworkThread())
      reap([object] { delete object; });
    else
      delete object;
  }
};

template <class T, class... A>
std::shared_ptr<T> makeShared(A&&... args) {
  return std::shared_ptr<T>(new T(std::forward<A>(args)...), ReapingDelete<T>{});
}

}  // namespace ko
