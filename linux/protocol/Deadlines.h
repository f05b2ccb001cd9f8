// How long everything that waits may wait: what is inside of something else gives up first, so
// that the innermost error, which says most, is the one that is told.
#pragma once

#include <chrono>

namespace skein::deadlines {

using namespace std::chrono_literals;
using Duration = std::chrono::milliseconds;

// A probe of a peer that let a message's deadline pass.
inline constexpr Duration kProbe = 500ms;
// A program that is started, until it accepts connections.
inline constexpr Duration kProgramStart = 3400ms;
// One message to vald, and its answer.
inline constexpr Duration kMessage = 3600ms;
// One request to the host, from its arrival to its answer.
inline constexpr Duration kRequest = 4200ms;
// One page of a listing: a link to vald is made before the first.
inline constexpr Duration kPage = 7700ms;
// What a new connection may take to say something.
inline constexpr Duration kFirstMessage = 5s;
// Any other answer of vald's that a thread waits for: it may follow several messages.
inline constexpr Duration kAnswer = 60s;
// One change of the store. The disk and other programs may hold it up.
inline constexpr Duration kChange = 120s;
// One request to the host that changes the store: a tree is removed in as long as it takes.
inline constexpr Duration kLongRequest = 10min;
// What a person waits for a command while vald does not answer.
inline constexpr Duration kCommand = 5s;

static_assert(kProgramStart < kMessage);
static_assert(kMessage + kProbe < kRequest);
static_assert(kRequest < kCommand);
static_assert(2 * kMessage + kProbe <= kPage);
static_assert(kMessage < kFirstMessage);
static_assert(kPage < kAnswer);
static_assert(kAnswer < kChange);
static_assert(kChange < kLongRequest);

}  // namespace skein::deadlines
