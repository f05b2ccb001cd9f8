# The cloud's records; see LocalRecords.h. Names, paths and identifiers are bytes, never
# text. A null pointer is nil; an empty one is empty.
@0xd14c7e02b85f9a63;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";

interface Records {
  # `records` null: there is no answer. Each record's zone is an index into `zones`.
  contentRecordIDs @0 (documents :List(Types.ObjectID))
      -> (zones :List(ZoneID), records :List(ContentRecordID), error :Types.Error);
  fetchRecords @1 (query :RecordQuery) -> (fetch :RecordFetch, error :Types.Error);
}

# A request to the cloud. It begins when its records are asked for, once; the client's last
# reference ends it, as cancel() does.
interface RecordFetch {
  records @0 () -> (records :List(Record), error :Types.Error);
  cancel @1 ();
}

struct ZoneID {
  zoneName @0 :Data;
  ownerName @1 :Data;
}

struct ContentRecordID {
  document @0 :Types.ObjectID;
  recordName @1 :Data;
  zone @2 :UInt32;
}

struct RecordQuery {
  zone @0 :ZoneID;
  recordNames @1 :List(Data);
  desiredKeys @2 :List(Data);
  qualityOfService @3 :Int32;
  discretionaryNetworkBehavior @4 :Int32;
  automaticallyRetryNetworkFailures @5 :Bool;
  group @6 :Data;
}

# Of the query's zone.
struct Record {
  recordName @0 :Data;
  fields @1 :List(Field);
  error @2 :Types.Error;  # then there are no fields

  struct Field {
    key @0 :Data;
    union {
      text @1 :Data;
      number @2 :Int64;
      asset @3 :Data;  # a file's path; null when the file was not fetched
    }
  }
}
