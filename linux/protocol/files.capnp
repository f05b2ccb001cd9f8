# What vald does to documents; see LocalFiles.h. Names, paths and identifiers are bytes,
# never text. A null pointer is nil; an empty one is empty. `item`: the item that was looked up
# at the URL, where one was; another one that is there by now is left alone.
@0xe8a41d5b90c7263f;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";

interface Files {
  importDocument @0 (source :Data, folder :Data, name :Data, origin :Data,
                     observer :TransferObserver)
      -> (transfer :Transfer, error :Types.Error);
  createFolder @1 (folder :Data, name :Data, origin :Data) -> (url :Data, error :Types.Error);
  makeAlias @2 (folder :Data, name :Data, target :Data, origin :Data)
      -> (url :Data, error :Types.Error);
  rename @3 (url :Data, newName :Data, origin :Data, item :Types.ObjectID)
      -> (url :Data, error :Types.Error);
  move @4 (url :Data, folder :Data, newName :Data, bounce :Bool, origin :Data,
           item :Types.ObjectID, observer :TransferObserver)
      -> (transfer :Transfer, error :Types.Error);
  remove @5 (url :Data, origin :Data, observer :TransferObserver, item :Types.ObjectID)
      -> (transfer :Transfer, error :Types.Error);
  trash @6 (url :Data, origin :Data, item :Types.ObjectID)
      -> (url :Data, error :Types.Error);

  putBackURL @7 (url :Data) -> (url :Data, error :Types.Error);
  capabilityToMove @8 (url :Data, toURL :Data) -> (capability :UInt64, error :Types.Error);
  coordinateDeletion @9 (url :Data, item :Types.ObjectID)
      -> (url :Data, error :Types.Error);
  physicalURL @10 (url :Data) -> (url :Data, isMarker :Bool, error :Types.Error);

  setTagNames @11 (url :Data, names :List(Data), item :Types.ObjectID)
      -> (error :Types.Error);
  # The date in nanoseconds since 1970.
  setLastOpenDate @12 (url :Data, hasDate :Bool, date :Int64, item :Types.ObjectID)
      -> (error :Types.Error);
  setFavoriteRank @13 (url :Data, hasRank :Bool, rank :Int64, item :Types.ObjectID)
      -> (error :Types.Error);
  tagsInUse @14 (after :Data) -> (tags :List(TagUse), error :Types.Error);

  download @15 (url :Data, currentVersion :Bool, observer :TransferObserver,
                item :Types.ObjectID)
      -> (transfer :Transfer, error :Types.Error);
  evict @16 (url :Data, item :Types.ObjectID) -> (error :Types.Error);
  setPinned @17 (url :Data, pinned :Bool, item :Types.ObjectID) -> (error :Types.Error);

  trashedItems @18 (offset :UInt64, limit :UInt64)
      -> (items :List(TrashedItem), nextOffset :UInt64, error :Types.Error);
  history @19 (path :Data, identifier :Data, limit :UInt64)
      -> (entries :List(FileHistoryEntry), error :Types.Error);
}

# Bytes on their way, a move, or a removal. vald's end: the client's last reference ends it, as
# cancel() does.
interface Transfer {
  # When it has ended, however it did; the counts are the last ones.
  result @0 () -> (url :Data, error :Types.Error, completedBytes :Int64, totalBytes :Int64);
  cancel @1 ();
}

# The client's end of a transfer.
interface TransferObserver {
  progress @0 (completedBytes :Int64, totalBytes :Int64);
}

struct TrashedItem {
  item @0 :Types.Item;
  url @1 :Data;
  putBackURL @2 :Data;
  hasDate @3 :Bool;
  trashed @4 :Int64;
}

struct TagUse {
  name @0 :Data;
  items @1 :UInt64;
}

struct FileHistoryEntry {
  when @0 :Int64;
  operation @1 :Data;
  origin @2 :Data;
  identifier @3 :Data;
  path @4 :Data;
  destination @5 :Data;
  undone @6 :Bool;
}
