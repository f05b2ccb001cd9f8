#pragma once

#include <memory>

#include "linux/protocol/LocalShares.h"

namespace skein {

class DaemonCalls;

// vald's shares, as a proxy whose messages are `calls`.
std::unique_ptr<LocalShares> makeSharesProxy(DaemonCalls calls);

}  // namespace skein
