#pragma once

#include <memory>

#include "linux/protocol/LocalRecords.h"

namespace skein {

class DaemonCalls;

// The cloud's records, as a proxy whose messages are `calls`.
std::unique_ptr<LocalRecords> makeRecordsProxy(DaemonCalls calls);

}  // namespace skein
