# Thumbnails, as the command line asks skein-host for them; see HostThumbnails.h. Paths and
# identifiers are bytes, never text. A null pointer is nil; an empty one is empty.
@0xf3b86d17ca50e294;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using HostTypes = import "hosttypes.capnp";
using Types = import "types.capnp";

interface HostThumbnails {
  fetchThumbnails @0 (targets :List(HostTypes.Target), width :Float64, height :Float64)
      -> (batch :ThumbnailBatch, error :Types.Error);
}

interface ThumbnailBatch {
  next @0 () -> (thumbnails :List(Thumbnail), done :UInt64, total :UInt64, finished :Bool,
                 error :Types.Error);
}

struct Thumbnail {
  index @0 :UInt32;
  kind @1 :UInt8;
  data @2 :Data;
  type @3 :Data;
  error @4 :Types.Error;
}
