#include "tests/support/ManualExecutor.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <iostream>
#include <string_view>
#include <utility>

namespace skein {
namespace {

constexpr std::size_t kMostRuns = 10'000'000;

[[noreturn]] void failAtOnce(std::string_view reason) {
  const auto* test = testing::UnitTest::GetInstance()->current_test_info();
  std::cerr << "ManualExecutor: " << reason;
  if (test != nullptr) std::cerr << " [" << test->test_suite_name() << '.' << test->name() << ']';
  std::cerr << std::endl;
  std::abort();
}

}  // namespace

ManualExecutor::~ManualExecutor() {
  // Destroying a task may post another one.
  for (;;) {
    std::deque<Task> left;
    {
      MutexLock lock(_mutex);
      left.swap(_tasks);
    }
    if (left.empty()) return;
  }
}

void ManualExecutor::post(Task task) {
  MutexLock lock(_mutex);
  _tasks.push_back(std::move(task));
}

bool ManualExecutor::runOne() {
  Task task;
  {
    MutexLock lock(_mutex);
    if (_tasks.empty()) return false;
    task = std::move(_tasks.front());
    _tasks.pop_front();
  }
  task();
  return true;
}

std::size_t ManualExecutor::runAll() {
  std::size_t ran = 0;
  while (runOne()) {
    if (++ran == kMostRuns) failAtOnce("runAll() finds no end: work keeps posting work");
  }
  return ran;
}

std::size_t ManualExecutor::pending() const {
  MutexLock lock(_mutex);
  return _tasks.size();
}

void ManualExecutor::beginWait() {
  failAtOnce(
      "a synchronous dispatch would wait for ever: its queue has work that only this test could "
      "run. Run the pending work first (runAll), or the code under test waits where it must not.");
}

}  // namespace skein
