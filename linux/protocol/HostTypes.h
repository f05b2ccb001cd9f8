// What the command line and skein-host speak of.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "base/UniqueFunction.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"

namespace skein {

// What a request is about: a path that begins at the drive's root ("/"), bytes, or an item
// identifier, the reserved ones included.
struct HostTarget {
  enum class Kind : std::uint8_t { Path, Identifier };
  Kind kind = Kind::Path;
  std::string text = "/";

  static HostTarget path(std::string text) { return {Kind::Path, std::move(text)}; }
  static HostTarget identifier(std::string text) { return {Kind::Identifier, std::move(text)}; }
};

enum class HostOrder : std::uint8_t { Name = 0, Date = 1 };

// One item, and where it is.
struct HostItem {
  NSFileProviderItemPtr item;
  std::string path;  // from the drive's root
  std::string url;   // of the file itself
};

// Something in the trash, and the path from the drive's root that it had; empty when that is
// not known.
struct HostTrashedItem {
  HostItem item;
  std::string putBackPath;
  std::optional<NSDate> trashed;
};

// Something that is taken out bit by bit. next() may be called again before the answer
// came; answers come in order. Letting go of the stream ends it.
template <class... Values>
class HostStream {
 public:
  virtual ~HostStream() = default;
  virtual void next(Reply<Values..., NSErrorPtr> reply) = 0;
};

}  // namespace skein
