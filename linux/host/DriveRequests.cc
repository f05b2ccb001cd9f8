#include "linux/host/DriveRequests.h"

#include "vellum/VLErrors.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr auto kBetweenTries = 50ms;
// An error that took longer is not that of a connection that was just closed.
constexpr auto kAtOnce = 1s;

}  // namespace

void DriveRequests::reachVald(int tries, UniqueFunction<void(NSErrorPtr)> then) {
  const auto shared = std::make_shared<UniqueFunction<void(NSErrorPtr)>>(std::move(then));
  const auto answered = [self = shared_from_this(), tries, shared,
                         begin = Clock::now()](const NSErrorPtr& error) {
    const bool wasLost = error && error->domain() == VLVellumErrorDomain &&
                         error->code() == VLVellumErrorDaemonUnreachable;
    if (!wasLost || tries == 1 || Clock::now() - begin > kAtOnce) return (*shared)(error);
    self->tools().timers->after(
        kBetweenTries, [self, tries, shared]() { self->reachVald(tries - 1, std::move(*shared)); });
  };
  // Either the reply or the error handler runs.
  _daemon(answered)->containers([answered](const std::vector<VLContainer::Properties>&,
                                           const NSErrorPtr& error) { answered(error); });
}

void DriveRequests::findIdentifier(HostTarget target, Reply<std::string, NSErrorPtr> reply) {
  withDrive<std::string>(std::move(reply), [self = shared_from_this(), target = std::move(target)](
                                               const Timed<std::string>& timed) {
    NSErrorPtr error;
    auto identifier = self->resolve(target, &error);
    (*timed)(std::move(identifier).value_or(""), std::move(error));
  });
}

std::optional<NSFileProviderItemIdentifier> DriveRequests::resolve(const HostTarget& target,
                                                                   NSErrorOut error) const {
  if (target.kind == HostTarget::Kind::Identifier) return target.text;
  return _paths.identifierForPath(target.text, error);
}

HostItem DriveRequests::place(NSFileProviderItemPtr item) const {
  HostItem placed;
  if (!item) return placed;
  const NSURLPtr url = extension().URLForItemWithPersistentIdentifier(item->itemIdentifier());
  if (url) placed.url = url->absoluteString();
  // By the folder, as the URL of an alias is its target's.
  const auto folder = _paths.pathForIdentifier(item->parentItemIdentifier(), nullptr);
  if (item->itemIdentifier() == NSFileProviderRootContainerItemIdentifier) {
    placed.path = "/";
  } else if (folder && !item->isTrashed()) {
    placed.path = (*folder == "/" ? "" : *folder) + '/' + item->filename();
  } else {
    placed.path = _paths.pathForURL(url).value_or("");
  }
  placed.item = std::move(item);
  return placed;
}

}  // namespace skein
