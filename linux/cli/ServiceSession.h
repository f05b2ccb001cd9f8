#pragma once

#include <memory>
#include <string>
#include <tuple>
#include <utility>

#include "linux/cli/Commands.h"
#include "linux/client/SkeinServices.h"

namespace skein::cli {

// Ctrl-C, while a command waits for a service: the first one cancels what is under way,
// which then answers; another one, or one with nothing under way, ends the program.
class InterruptCancels {
 public:
  // Before other threads are started: they inherit that the signal is not theirs.
  InterruptCancels();

  // From now on `progress` is what is cancelled; null: nothing is.
  void watch(std::shared_ptr<NSProgress> progress);

 private:
  struct State;
  const std::shared_ptr<State> _state;
};

// A command's way to the services of the drive's items.
struct ServiceSession {
  SkeinServices& services;
  InterruptCancels& interrupts;

  // Makes a request of a service and waits for its reply, as awaitReply does.
  template <class... Values, class Start>
  std::tuple<Values..., NSErrorPtr> ask(Start start) {
    auto answer = awaitReply<Values...>(
        std::move(start),
        [&](std::shared_ptr<NSProgress> progress) { interrupts.watch(std::move(progress)); });
    interrupts.watch(nullptr);
    return answer;
  }
};

// Opens the drive's services and runs `command(session)`; complains when there is no drive.
template <class Command>
int withServices(const Invocation& invocation, Command command) {
  InterruptCancels interrupts;
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.paths(&error);
  if (paths.store.empty()) return complainAbout(error);
  const auto services = SkeinServices::open(paths.store, &error);
  if (!services) return complainAbout(error);
  ServiceSession session{*services, interrupts};
  return command(session);
}

}  // namespace skein::cli
