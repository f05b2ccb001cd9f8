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
  keeping @9 :CloudKeeping;
  keptLimit @10 :UInt64;
  keptFiles @11 :UInt64;
  keptBytes @12 :UInt64;
  onlyCopiesBytes @13 :UInt64;
}

struct CloudKeeping {
  days @0 :UInt32;
  percent @1 :UInt32;
}

struct CloudCollection {
  freedFiles @0 :UInt64;
  freedBytes @1 :UInt64;
  keptFiles @2 :UInt64;
  keptBytes @3 :UInt64;
}

struct CloudFault {
  path @0 :Data;
  why @1 :Data;
}

struct CloudVerification {
  faults @0 :List(CloudFault);
  done @1 :UInt64;
  bytes @2 :UInt64;
}

interface Cloud {
  setConditions @0 (conditions :CloudConditions) -> (error :Types.Error);
  cloudStatus @1 () -> (status :CloudStatus, error :Types.Error);
  setKeeping @2 (keeping :CloudKeeping) -> (error :Types.Error);
  collect @3 () -> (collection :CloudCollection, error :Types.Error);
  verify @4 (markers :List(Data), quick :Bool)
      -> (verification :CloudVerification, error :Types.Error);
}
