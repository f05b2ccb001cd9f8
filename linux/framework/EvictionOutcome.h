#pragma once

#include "platform/foundation/NSError.h"

namespace skein {

// What became of the file that the extension is told to stop providing. Its operation answers
// nothing, and whoever asked for an eviction wants to know: so while a scope stands, the
// framework notes there what an eviction on this thread ended with.
class EvictionOutcomeScope {
 public:
  EvictionOutcomeScope();
  ~EvictionOutcomeScope();
  EvictionOutcomeScope(const EvictionOutcomeScope&) = delete;
  EvictionOutcomeScope& operator=(const EvictionOutcomeScope&) = delete;

  // Notes it with the calling thread's scope; nothing happens outside every scope.
  static void note(NSErrorPtr error);

  // Whether the extension asked for an eviction, and its error; null when it succeeded.
  bool wasAsked() const { return _wasAsked; }
  const NSErrorPtr& error() const { return _error; }

 private:
  EvictionOutcomeScope* const _outer;
  bool _wasAsked = false;
  NSErrorPtr _error;
};

}  // namespace skein
