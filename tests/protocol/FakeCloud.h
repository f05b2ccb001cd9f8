// vald's local cloud as a test scripts it: it notes its conditions and answers what it was
// told to.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "linux/protocol/LocalCloud.h"

namespace skein {

class FakeCloud final : public LocalCloud {
 public:
  // What is answered; set it before asking.
  LocalCloudStatus status;
  LocalCloudCollection collection;
  NSErrorPtr error;

  void setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override {
    status.conditions = conditions;
    reply(error);
  }
  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override { reply(status, error); }
  void setKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) override {
    status.keeping = keeping;
    reply(error);
  }
  void verify(std::vector<std::string> markers, bool quick,
              Reply<LocalCloudVerification, NSErrorPtr> reply) override {
    LocalCloudVerification verification;
    for (std::string& marker : markers) verification.faults.push_back({std::move(marker), "gone"});
    verification.done = quick ? 1 : 2;
    verification.bytes = ~0ULL;
    reply(std::move(verification), error);
  }
  void collect(Reply<LocalCloudCollection, NSErrorPtr> reply) override { reply(collection, error); }
};

}  // namespace skein
