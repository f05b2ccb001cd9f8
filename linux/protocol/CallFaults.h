// Faults in vald's answers, for tests and trials of its clients. Every call of every object
// that vald serves can have them, save those of kept() in CallFaults.cc.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/protocol/LocalDaemon.h"

namespace skein {

// What was planned. Called on the loop's thread; answers at once.
class CallFaults {
 public:
  virtual ~CallFaults() = default;
  // What the next call of `method` is to do; nil: nothing special.
  virtual std::optional<FaultInjection> take(std::string_view method) = 0;
};

struct FaultableMethod {
  std::string name;
  bool answersErrors;  // otherwise it can only come late or lose its connection
};
// By name; methods of one name are one.
std::vector<FaultableMethod> faultableMethods();

}  // namespace skein
