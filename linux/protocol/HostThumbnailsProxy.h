#pragma once

#include <memory>

#include "linux/protocol/HostThumbnails.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// skein-host's thumbnails over its socket; replies and errors as makeHostClient() says.
std::unique_ptr<HostThumbnails> makeHostThumbnailsProxy(std::shared_ptr<SocketClient> socket);

}  // namespace skein
