# What vald's local cloud does, and how it is tried out; see LocalCloud.h. Texts are bytes,
# never text. An empty one is empty.
@0xd3fa02d6bbe3bd93;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";

struct CloudConditions {
  offline @0 :Bool;
  corrupt @1 :Bool;
  hasQuota @2 :Bool;
  quota @3 :UInt64;
  delayMilliseconds @4 :UInt32;
  bytesPerSecond @5 :UInt64;
  failures @6 :UInt32;
}

struct CloudStatus {
  uploads @0 :UInt8;
  uploadLimit @1 :UInt64;
  sharesBlocks @2 :Bool;
  usedBytes @3 :UInt64;
  waiting @4 :UInt64;
  failed @5 :UInt64;
  leftOut @6 :UInt64;
  lastFailure @7 :Data;
  conditions @8 :CloudConditions;
}

interface Cloud {
  setConditions @0 (conditions :CloudConditions) -> (error :Types.Error);
  cloudStatus @1 () -> (status :CloudStatus, error :Types.Error);
}
