#include "linux/framework/EvictionOutcome.h"

#include <utility>

namespace skein {
namespace {

thread_local EvictionOutcomeScope* scopeOfThread = nullptr;

}  // namespace

EvictionOutcomeScope::EvictionOutcomeScope() : _outer(std::exchange(scopeOfThread, this)) {}

EvictionOutcomeScope::~EvictionOutcomeScope() { scopeOfThread = _outer; }

void EvictionOutcomeScope::note(NSErrorPtr error) {
  if (scopeOfThread == nullptr) return;
  scopeOfThread->_wasAsked = true;
  scopeOfThread->_error = std::move(error);
}

}  // namespace skein
