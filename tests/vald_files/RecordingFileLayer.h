#pragma once

#include <functional>
#include <string_view>

#include "linux/vald/files/FaultyFileLayer.h"

namespace skein::vald {

// Tells of each step before it is taken: which, and of what.
class RecordingFileLayer final : public FaultyFileLayer {
 public:
  std::function<void(FileStep, std::string_view)> before;

 protected:
  int beforeStep(FileStep step, std::string_view name) override {
    if (before) before(step, name);
    return FaultyFileLayer::beforeStep(step, name);
  }
};

}  // namespace skein::vald
