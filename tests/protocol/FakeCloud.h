// vald's local cloud as a test scripts it: it notes its conditions and answers what it was
// told to.
#pragma once

#include <utility>

#include "linux/protocol/LocalCloud.h"

namespace skein {

class FakeCloud final : public LocalCloud {
 public:
  // What is answered; set it before asking.
  LocalCloudStatus status;
  NSErrorPtr error;

  void setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override {
    status.conditions = conditions;
    reply(error);
  }
  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override { reply(status, error); }
};

}  // namespace skein
