#pragma once

#include <memory>
#include <string>
#include <thread>
#include <utility>

#include "base/UniqueFunction.h"

namespace skein {

struct RpcIo;  // linux/protocol/RpcConnection.h

// The one thread of a process that does its socket work.
//
// What belongs to the RPC library (connections, references, promises) is made, used and
// destroyed on this thread alone; other threads reach it with post(), and hold such things
// in handles made with own(). Nothing that may wait ever runs here: whatever answers a
// person or asks the file system goes to an executor.
class RpcLoop : public std::enable_shared_from_this<RpcLoop> {
 public:
  // Starts the thread. `name` is shown by debuggers, cut at 15 bytes.
  static std::shared_ptr<RpcLoop> start(const std::string& name);

  // Runs what was posted before, then ends the thread. Every handle keeps the loop alive.
  ~RpcLoop();
  RpcLoop(const RpcLoop&) = delete;
  RpcLoop& operator=(const RpcLoop&) = delete;

  // Runs `task` on the loop's thread, later, in the order of posting. Any thread.
  void post(Task task);

  // Runs `task` there and returns when it has run. For ends of programs, where what a task
  // names is about to go. Any thread; the loop's own runs it at once.
  void postAndWait(Task task);

  bool isCurrent() const;

  // The thread's event loop, timer and sockets; on its own thread only.
  RpcIo& io();

  // Makes `object` shared among threads while its destructor runs on the loop's thread,
  // as a task of its own: an object may lose its last reference inside its own promise.
  template <class T>
  std::shared_ptr<T> own(std::unique_ptr<T> object) {
    return std::shared_ptr<T>(object.release(), [loop = shared_from_this()](T* dying) {
      loop->post([dying] { delete dying; });
    });
  }

 private:
  struct State;
  explicit RpcLoop(const std::string& name);

  // Shared with the thread, which may be the one that drops the last handle.
  std::shared_ptr<State> _state;
  std::thread _thread;
};

}  // namespace skein
