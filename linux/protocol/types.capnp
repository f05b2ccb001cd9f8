# What the schemas share. Names, paths and identifiers are bytes, never text. A null pointer
# is nil; an empty one is empty.
@0xb7d2e96c1f3a5840;

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
