# What the command line asks of skein-host about documents; see HostFiles.h. Names, paths
# and identifiers are bytes, never text. A null pointer is nil; an empty one is empty.
@0xc95d2a70e1f84b36;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Files = import "files.capnp";
using HostTypes = import "hosttypes.capnp";
using Types = import "types.capnp";

using HostItem = HostTypes.HostItem;
using Target = HostTypes.Target;

interface HostFiles {
  contents @0 (target :Target, currentVersion :Bool)
      -> (transfer :HostTransfer, error :Types.Error);
  evict @1 (target :Target) -> (error :Types.Error);
  setPinned @2 (target :Target, pinned :Bool) -> (error :Types.Error);

  importDocument @3 (source :Data, parent :Target, origin :Data)
      -> (transfer :HostTransfer, error :Types.Error);
  createDirectory @4 (name :Data, parent :Target, origin :Data)
      -> (item :HostItem, error :Types.Error);
  makeAlias @5 (target :Target, outside :Bool, name :Data, parent :Target, origin :Data)
      -> (item :HostItem, error :Types.Error);
  rename @6 (target :Target, newName :Data, origin :Data)
      -> (item :HostItem, error :Types.Error);
  reparent @7 (target :Target, parent :Target, newName :Data, origin :Data)
      -> (transfer :HostTransfer, error :Types.Error);
  trash @8 (target :Target, origin :Data) -> (item :HostItem, error :Types.Error);
  untrash @9 (target :Target, parent :Target, origin :Data)
      -> (item :HostItem, error :Types.Error);
  remove @10 (target :Target, origin :Data) -> (transfer :HostTransfer, error :Types.Error);
  trashedItems @11 () -> (trash :HostTrash, error :Types.Error);

  setTags @12 (target :Target, names :List(Data)) -> (item :HostItem, error :Types.Error);
  tagsInUse @13 (after :Data) -> (tags :List(Files.TagUse), error :Types.Error);
  setFavoriteRank @14 (target :Target, hasRank :Bool, rank :Int64)
      -> (item :HostItem, error :Types.Error);
  # The date in nanoseconds since 1970.
  setLastUsedDate @15 (target :Target, hasDate :Bool, date :Int64)
      -> (item :HostItem, error :Types.Error);

  defaultContainer @16 (bundleIdentifier :Data) -> (item :HostItem, error :Types.Error);
  history @17 (target :Target, limit :UInt64)
      -> (entries :List(Files.FileHistoryEntry), error :Types.Error);
}

# Streams, as those of host.capnp.
interface HostTransfer {
  next @0 () -> (completedBytes :UInt64, totalBytes :UInt64, finished :Bool, item :HostItem,
                 error :Types.Error);
  cancel @1 ();
}
interface HostTrash {
  next @0 () -> (items :List(HostTrashedItem), last :Bool, error :Types.Error);
}

struct HostTrashedItem {
  item @0 :HostItem;
  putBackPath @1 :Data;
  hasDate @2 :Bool;
  trashed @3 :Int64;
}
