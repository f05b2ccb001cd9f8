# The shares of a drive's items; see LocalShares.h. Names, paths and identifiers are bytes,
# never text. A null pointer is nil; an empty one is empty.
@0x9c3e5a7f1d60b824;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";

struct Share {
  rootRecordName @0 :Data;
  values @1 :List(Value);
  participants @2 :List(Participant);
  publicPermission @3 :Int64;
  isKnownToServer @4 :Bool;
  address @5 :Data;

  struct Value {
    key @0 :Data;
    text @1 :Data;
  }
  struct Participant {
    name @0 :Data;
    role @1 :UInt8;
    acceptanceStatus @2 :UInt8;
    permission @3 :Int64;
  }
}

struct Zone {
  zoneName @0 :Data;
  ownerName @1 :Data;
}

struct AttachedZone {
  folder @0 :Data;
  zone @1 :Zone;
  permission @2 :Int64;
}

struct ShareOptions {
  flags @0 :Int64;
  ownFlags @1 :Int64;
  publicPermission @2 :Int64;
  sharedFolder @3 :Data;
}

# Those that answer late may be given up: a client cancels by letting go of its call.
interface Shares {
  copyShare @0 (url :Data) -> (share :Share, folder :Data, error :Types.Error);
  newShare @1 (url :Data) -> (share :Share, error :Types.Error);
  copyShareURL @2 (url :Data) -> (address :Data, error :Types.Error);
  saveShare @3 (share :Share) -> (share :Share, error :Types.Error);
  destroyShare @4 (share :Share) -> (error :Types.Error);
  copyShareTokens @5 (url :Data) -> (shareToken :Data, baseToken :Data, error :Types.Error);

  answerInvitation @6 (address :Data, participant :Data, accepts :Bool) -> (error :Types.Error);
  attachZone @7 (folder :Data, zone :Zone, permission :Int64) -> (error :Types.Error);
  detachZone @8 (folder :Data) -> (error :Types.Error);
  attachedZones @9 () -> (zones :List(AttachedZone), error :Types.Error);

  isShareable @10 (item :Types.ObjectID) -> (shareable :Bool, error :Types.Error);
  refreshSharingState @11 (identifier :Data) -> (error :Types.Error);
  shareOptions @12 (identifier :Data) -> (options :ShareOptions, error :Types.Error);
}
