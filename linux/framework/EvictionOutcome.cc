#include "linux/framework/EvictionOutcome.h"

#include <utility>

namespace skein {
namespace {

thread_local EvictionOutcomeScope* evictionOfThread = nullptr;

}  // namespace

EvictionOutcomeScope::EvictionOutcomeScope() : _outer(std::exchange(evictionOfThread, this)) {}

EvictionOutcomeScope::~EvictionOutcomeScope() { evictionOfThread = _outer; }

void EvictionOutcomeScope::note(NSErrorPtr error) {
  if (evictionOfThread == nullptr) return;
  evictionOfThread->_wasAsked = true;
  evictionOfThread->_error = std::move(error);
}

}  // namespace skein
