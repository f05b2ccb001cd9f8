# What crosses the socket between skein-host and the command line. Names, paths and
# identifiers are bytes, never text. A null pointer is nil; an empty one is empty.
@0xd3a1f2c4b5968778;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Cloud = import "cloud.capnp";
using Daemon = import "daemon.capnp";
using HostFiles = import "hostfiles.capnp";
using HostThumbnails = import "hostthumbnails.capnp";
using HostTypes = import "hosttypes.capnp";
using Types = import "types.capnp";

using HostItem = HostTypes.HostItem;
using Target = HostTypes.Target;

struct Change {
  kind @0 :UInt8;
  identifier @1 :Data;
  filename @2 :Data;
  previousFilename @3 :Data;
  item @4 :Types.Item;
}

struct HostStatus {
  daemon @0 :Daemon.Status;
  processID @1 :Int64;
  watchedContainers @2 :UInt64;
  debugLog @3 :Bool;
}

struct HostDifference {
  kind @0 :UInt8;
  path @1 :Data;
  detail @2 :Data;
}

interface Host extends(HostFiles.HostFiles, HostThumbnails.HostThumbnails) {
  list @0 (container :Target, order :UInt8) -> (listing :Listing, error :Types.Error);
  item @1 (target :Target) -> (item :HostItem, error :Types.Error);
  identifierForPath @2 (path :Data) -> (identifier :Data, error :Types.Error);
  pathForIdentifier @3 (identifier :Data) -> (path :Data, error :Types.Error);
  watch @4 (container :Target) -> (watch :Watch, error :Types.Error);
  changesSince @5 (token :Data)
      -> (updates :List(Types.Item), deletions :List(Data), token :Data, moreComing :Bool,
          error :Types.Error);
  account @6 () -> (account :Daemon.Account, error :Types.Error);
  logIn @7 (account :Daemon.Account) -> (error :Types.Error);
  logOut @8 () -> (error :Types.Error);
  status @9 () -> (status :HostStatus, error :Types.Error);
  check @10 (quick :Bool) -> (check :Check, error :Types.Error);
  setDebugLog @11 (enabled :Bool) -> (error :Types.Error);
  services @12 () -> (services :Capability);  # Services of services.capnp
  cloudStatus @13 () -> (status :Cloud.CloudStatus, error :Types.Error);
  setCloudConditions @14 (conditions :Cloud.CloudConditions) -> (error :Types.Error);
  setCloudKeeping @15 (keeping :Cloud.CloudKeeping) -> (error :Types.Error);
  collectCloud @16 () -> (collection :Cloud.CloudCollection, error :Types.Error);
}

# Streams: each ends when its last reference goes. next may be called again before the
# answer to the call before came; that is what keeps a listing flowing.
interface Listing {
  next @0 () -> (items :List(Types.Item), last :Bool, error :Types.Error);
}
interface Watch {
  next @0 () -> (changes :List(Change), error :Types.Error);
}
interface Check {
  next @0 () -> (differences :List(HostDifference), folders :UInt64, items :UInt64,
                 finished :Bool, error :Types.Error, verified :UInt64, verifiedBytes :UInt64);
}
