#pragma once

#include <memory>
#include <optional>
#include <string>
#include <tuple>
#include <utility>

#include "linux/cli/Commands.h"
#include "linux/cli/Interruption.h"
#include "linux/client/SkeinServices.h"

namespace skein::cli {

// A command's way to the services of the drive's items.
struct ServiceSession {
  SkeinServices& services;

  // Makes a request of a service and waits for its reply, as awaitReply does. An interruption
  // cancels a request that can be cancelled, which then answers.
  template <class... Values, class Start>
  std::tuple<Values..., NSErrorPtr> ask(Start start) {
    std::optional<NotedInterruption> noted;
    std::optional<OnInterruption> cancels;
    return awaitReply<Values...>(std::move(start), [&](std::shared_ptr<NSProgress> progress) {
      noted.emplace();
      cancels.emplace([progress = std::move(progress)] { progress->cancel(); });
    });
  }
};

// Opens the drive's services and runs `command(session)`; complains when there is no drive.
template <class Command>
int withServices(const Invocation& invocation, Command command) {
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.paths(&error);
  if (paths.store.empty()) return complainAbout(error);
  const auto services = SkeinServices::open(paths.store, &error);
  if (!services) return complainAbout(error);
  ServiceSession session{*services};
  return command(session);
}

}  // namespace skein::cli
