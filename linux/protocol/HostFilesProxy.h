#pragma once

#include <memory>

#include "linux/protocol/HostFiles.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// skein-host's file operations over its socket; replies and errors as makeHostClient() says.
std::unique_ptr<HostFiles> makeHostFilesProxy(std::shared_ptr<SocketClient> socket);

}  // namespace skein
