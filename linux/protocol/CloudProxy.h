#pragma once

#include <memory>

#include "linux/protocol/LocalCloud.h"

namespace skein {

class DaemonCalls;

// vald's local cloud, as a proxy whose messages are `calls`.
std::unique_ptr<LocalCloud> makeCloudProxy(DaemonCalls calls);

}  // namespace skein
