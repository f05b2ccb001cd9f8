#pragma once

#include <memory>

#include "linux/protocol/LocalFiles.h"

namespace skein {

class DaemonCalls;

// vald's file operations, as a proxy whose messages are `calls`.
std::unique_ptr<LocalFiles> makeFilesProxy(DaemonCalls calls);

}  // namespace skein
