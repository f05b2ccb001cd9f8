# What crosses the socket between vald and its clients. Names, paths and identifiers are
# bytes, never text. A null pointer is nil; an empty one is empty.
@0xc5f0b6d0a1e94b37;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

# Errors travel as values. Exceptions of the RPC system mean that there was no answer.
struct Error {
  domain @0 :Data;
  code @1 :Int64;
  userInfo @2 :List(Entry);

  struct Entry {
    key @0 :Data;
    union {
      text @1 :Data;
      error @2 :Error;
      url @3 :Data;
      item @4 :Item;
    }
  }
}

struct ObjectID {
  rawID @0 :UInt64;
  isInode @1 :Bool;
}

struct Item {
  rawID @0 :UInt64;
  isInode @1 :Bool;
  kind @2 :UInt8;
  isDead @3 :Bool;
  isTrashed @4 :Bool;
  isUploaded @5 :Bool;
  isDownloaded @6 :Bool;
  isShared @7 :Bool;
  hasCreationDate @8 :Bool;
  hasContentModificationDate @9 :Bool;
  hasLastUsedDate @10 :Bool;
  hasFavoriteRank @11 :Bool;
  hasChildItemCount @12 :Bool;
  capabilities @13 :UInt64;
  size @14 :UInt64;
  # Dates in nanoseconds since 1970; the largest value is the distant future.
  creationDate @15 :Int64;
  contentModificationDate @16 :Int64;
  lastUsedDate @17 :Int64;
  favoriteRank @18 :Int64;
  childItemCount @19 :UInt64;
  itemIdentifier @20 :Data;  # null: the string form of rawID and isInode
  parentItemIdentifier @21 :Data;
  filename @22 :Data;
  typeIdentifier @23 :Data;
  tagData @24 :Data;
  containerID @25 :Data;
}

struct Account {
  name @0 :Data;
  perAppAccountIdentifier @1 :Data;
}

struct Container {
  containerID @0 :Data;
  documentsURL @1 :Data;
  displayName @2 :Data;
  icon @3 :Data;
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

interface Daemon {
  enumerateItemsInFolder @0 (folder :ObjectID, sortOrder :UInt8, offset :UInt64, limit :UInt64)
      -> (items :List(Item), nextOffset :UInt64, error :Error);
  enumerateAllFolders @1 (sortOrder :UInt8, offset :UInt64, limit :UInt64)
      -> (items :List(Item), nextOffset :UInt64, error :Error);
  currentNotifRank @2 () -> (rank :UInt64, error :Error);
  enumerateWorkingSetChanges @3 (changeToken :Data, limit :UInt64)
      -> (updates :List(Item), deletions :List(ObjectID), changeToken :Data, error :Error);
  getItemUpdateSender @4 (receiver :Receiver) -> (sender :Sender, error :Error);

  urlForFileObjectID @5 (fileObjectID :ObjectID) -> (url :Data, error :Error);
  queryItemForURL @6 (url :Data, scanFirst :Bool) -> (item :Item, error :Error);
  account @7 () -> (account :Account, error :Error);
  logIn @8 (account :Account) -> (error :Error);
  logOut @9 () -> (error :Error);
  containers @10 () -> (containers :List(Container), error :Error);
  subscribe @11 (events :Events) -> (error :Error);
  status @12 () -> (status :Status, error :Error);
  checkIndex @13 (limit :UInt64) -> (differences :List(Difference), error :Error);
  injectFault @14 (fault :Fault) -> (error :Error);
  stop @15 () -> (error :Error);
}

# vald's end of one watch; vald lets go of it with the last reference.
interface Sender {
  boostPriority @0 ();
  watchItem @1 (url :Data, options :UInt64) -> (error :Error);
  invalidate @2 ();
}

# The client's end of one watch.
interface Receiver {
  receiveUpdates @0 (items :List(Item), logicalExtensions :List(Data),
                     physicalExtensions :List(Data));
  receiveProgressUpdates @1 (items :List(Item));
  # The sender has ended by itself: nothing more is pushed.
  linkDidBreak @2 (error :Error);
}

interface Events {
  accountDidChange @0 (account :Account);
  containerListDidChange @1 ();
}
