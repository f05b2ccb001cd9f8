#include "linux/protocol/RpcLoop.h"

#include <kj/async-io.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <future>
#include <system_error>
#include <vector>

#include "base/Fault.h"
#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/RpcConnection.h"

namespace skein {

struct RpcLoop::State {
  void run(const std::string& name, std::promise<void>& started);
  void runPostedTasks();
  void post(Task task) SKEIN_EXCLUDES(mutex);
  void wake() const;

  FileDescriptor wakeUp;
  RpcIo* io = nullptr;                  // on the loop's thread only
  std::atomic<std::thread::id> thread;  // of the loop
  Mutex mutex;
  std::vector<Task> mailbox SKEIN_GUARDED_BY(mutex);
  bool stopping SKEIN_GUARDED_BY(mutex) = false;
};

void RpcLoop::State::wake() const {
  const std::uint64_t one = 1;
  // It can only fail when it is full, and then the loop is about to wake up anyway.
  [[maybe_unused]] const ssize_t written = ::write(wakeUp.get(), &one, sizeof one);
}

void RpcLoop::State::post(Task task) {
  {
    MutexLock lock(mutex);
    mailbox.push_back(std::move(task));
    if (mailbox.size() > 1) return;  // the loop was told already
  }
  wake();
}

void RpcLoop::State::runPostedTasks() {
  std::uint64_t count = 0;
  [[maybe_unused]] const ssize_t got = ::read(wakeUp.get(), &count, sizeof count);
  std::vector<Task> tasks;
  {
    MutexLock lock(mutex);
    tasks.swap(mailbox);
  }
  for (Task& task : tasks) {
    try {
      task();
    } catch (const std::exception& exception) {
      reportFault(std::string("a task on the RPC loop threw: ") + exception.what());
    }
    task = nullptr;
  }
}

void RpcLoop::State::run(const std::string& name, std::promise<void>& started) {
  pthread_setname_np(pthread_self(), name.substr(0, 15).c_str());
  kj::AsyncIoContext context = kj::setupAsyncIo();
  RpcIo shared{*context.lowLevelProvider, context.provider->getTimer(), context.unixEventPort};
  kj::UnixEventPort::FdObserver observer(context.unixEventPort, wakeUp.get(),
                                         kj::UnixEventPort::FdObserver::OBSERVE_READ);
  io = &shared;
  thread.store(std::this_thread::get_id(), std::memory_order_relaxed);
  started.set_value();
  for (;;) {
    observer.whenBecomesReadable().wait(context.waitScope);
    runPostedTasks();
    MutexLock lock(mutex);
    if (stopping && mailbox.empty()) break;
  }
  io = nullptr;
}

RpcLoop::RpcLoop(const std::string& name) : _state(std::make_shared<State>()) {
  _state->wakeUp = FileDescriptor(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!_state->wakeUp) throw std::system_error(errno, std::generic_category(), "eventfd");
  std::promise<void> started;
  _thread = std::thread([state = _state, name, &started] { state->run(name, started); });
  started.get_future().wait();
}

std::shared_ptr<RpcLoop> RpcLoop::start(const std::string& name) {
  return std::shared_ptr<RpcLoop>(new RpcLoop(name));
}

RpcLoop::~RpcLoop() {
  {
    MutexLock lock(_state->mutex);
    _state->stopping = true;
  }
  _state->wake();
  if (isCurrent()) {
    _thread.detach();
  } else {
    _thread.join();
  }
}

void RpcLoop::post(Task task) { _state->post(std::move(task)); }

void RpcLoop::postAndWait(Task task) {
  if (isCurrent()) {
    task();
    return;
  }
  std::promise<void> ran;
  post([&] {
    task();
    task = nullptr;
    ran.set_value();
  });
  ran.get_future().wait();
}

bool RpcLoop::isCurrent() const {
  return _state->thread.load(std::memory_order_relaxed) == std::this_thread::get_id();
}

RpcIo& RpcLoop::io() {
  if (!isCurrent() || _state->io == nullptr) {
    reportFault("RpcLoop::io() off the loop's thread");
    std::abort();  // there is nothing to give
  }
  return *_state->io;
}

}  // namespace skein
