#pragma once

#include <string_view>
#include <vector>

#include "linux/protocol/FileDescriptor.h"
#include "linux/rendering/RenderMessages.h"

namespace skein::thumbnailer {

// What a request's packet comes to: the document drawn into the memory file. Nil for a
// packet that is no request; nobody who means well sends one.
std::optional<RenderAnswer> answerRequest(std::string_view packet,
                                          const std::vector<FileDescriptor>& descriptors);

// Answers requests until the socket closes. The process's exit status.
int serveRequests(int socket, const Greeting& greeting);

}  // namespace skein::thumbnailer
