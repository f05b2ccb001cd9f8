// Why there is no picture of a document.
#pragma once

#include <cstdint>
#include <string>

#include "linux/rendering/RenderMessages.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Codes of SkeinRenderErrorDomain.
inline constexpr char SkeinRenderErrorDomain[] = "SkeinRenderErrorDomain";
enum class RenderFailure : std::int64_t {
  // About the document: trying again with the same contents is of no use.
  Malformed = 1,    // not what its type says, cut off, or protected by a password
  Empty = 2,        //
  TooLarge = 3,     // more pixels or bytes than are decoded here
  TookTooLong = 4,  // of the processor's time
  EndedWorker = 5,  // the decoder crashed, or ran out of memory
  // About this machine.
  Unsupported = 16,        // no loader for the type is installed
  WorkerNotStarted = 17,   // or it could not be locked down
  CouldNotBeWritten = 18,  // nor read
  NotInTime = 19,          // by the clock on the wall: the machine has too much to do
};

NSErrorPtr renderError(RenderFailure failure, std::string words);
// Of a status other than Drawn.
NSErrorPtr renderErrorOf(RenderStatus status, PictureKind kind);

// Whether the same contents would fail again.
bool isAboutDocument(const NSErrorPtr& error);

}  // namespace skein::vald
