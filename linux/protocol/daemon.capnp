# What crosses the socket between vald and its clients. Names, paths and identifiers are
# bytes, never text. A null pointer is nil; an empty one is empty.
@0xc5f0b6d0a1e94b37;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";
using Cloud = import "cloud.capnp";
using Files = import "files.capnp";
using Records = import "records.capnp";
using Shares = import "shares.capnp";

struct Account {
  name @0 :Data;
  perAppAccountIdentifier @1 :Data;
}

struct Container {
  containerID @0 :Data;
  documentsURL @1 :Data;
  displayName @2 :Data;
  icon @3 :Data;
  isIconUndecorated @4 :Bool;
}

struct Status {
  store @0 :Data;
  processID @1 :Int64;
  documents @2 :UInt64;
  folders @3 :UInt64;
  aliases @4 :UInt64;
  scan @5 :UInt8;
  scannedFolders @6 :UInt64;
  pendingFolders @7 :UInt64;
  unreadableFolders @8 :UInt64;
  watch @9 :UInt8;
  watchReason @10 :Data;
  watches @11 :UInt64;
  watchBudget @12 :UInt64;
  overflows @13 :UInt64;
  rank @14 :UInt64;
  oldestTokenRank @15 :UInt64;
  senders @16 :UInt64;
  account @17 :Account;
  notes @18 :List(Data);
}

struct Difference {
  kind @0 :UInt8;
  path @1 :Data;
  detail @2 :Data;
}

struct Fault {
  method @0 :Data;
  action @1 :UInt8;
  errorDomain @2 :Data;
  errorCode @3 :Int64;
  delayMilliseconds @4 :UInt32;
  times @5 :UInt32;
}

interface Daemon extends(Cloud.Cloud, Files.Files, Records.Records, Shares.Shares) {
  enumerateItemsInFolder @0 (folder :Types.ObjectID, sortOrder :UInt8, offset :UInt64,
                             limit :UInt64)
      -> (items :List(Types.Item), nextOffset :UInt64, error :Types.Error);
  enumerateAllFolders @1 (sortOrder :UInt8, offset :UInt64, limit :UInt64)
      -> (items :List(Types.Item), nextOffset :UInt64, error :Types.Error);
  currentNotifRank @2 () -> (rank :UInt64, error :Types.Error);
  enumerateWorkingSetChanges @3 (changeToken :Data, limit :UInt64)
      -> (updates :List(Types.Item), deletions :List(Types.ObjectID), changeToken :Data,
          error :Types.Error);
  getItemUpdateSender @4 (receiver :Receiver) -> (sender :Sender, error :Types.Error);

  urlForFileObjectID @5 (fileObjectID :Types.ObjectID) -> (url :Data, error :Types.Error);
  queryItemForURL @6 (url :Data, scanFirst :Bool) -> (item :Types.Item, error :Types.Error);
  account @7 () -> (account :Account, error :Types.Error);
  logIn @8 (account :Account) -> (error :Types.Error);
  logOut @9 () -> (error :Types.Error);
  containers @10 () -> (containers :List(Container), error :Types.Error);
  subscribe @11 (events :Events) -> (error :Types.Error);
  status @12 () -> (status :Status, error :Types.Error);
  checkIndex @13 (limit :UInt64) -> (differences :List(Difference), error :Types.Error);
  injectFault @14 (fault :Fault) -> (error :Types.Error);
  stop @15 () -> (error :Types.Error);
  getContainerURLForID @16 (containerID :Data, recreateDocumentsIfNeeded :Bool)
      -> (url :Data, displayName :Data, recreated :Bool, error :Types.Error);
  # One for each, in that order; null for an identifier that names nothing.
  urlsForFileObjectIDs @17 (fileObjectIDs :List(Types.ObjectID))
      -> (urls :List(Data), error :Types.Error);
}

# vald's end of one watch; vald lets go of it with the last reference.
interface Sender {
  boostPriority @0 ();
  # The item, wherever it is; where none is named, what is at the URL.
  watchItem @1 (url :Data, options :UInt64, item :Types.ObjectID) -> (error :Types.Error);
  invalidate @2 ();
}

# The client's end of one watch.
interface Receiver {
  receiveUpdates @0 (items :List(Types.Item), logicalExtensions :List(Data),
                     physicalExtensions :List(Data));
  receiveProgressUpdates @1 (items :List(Types.Item));
  # The sender has ended by itself: nothing more is pushed.
  linkDidBreak @2 (error :Types.Error);
}

interface Events {
  accountDidChange @0 (account :Account);
  containerListDidChange @1 ();
}
