# What the schemas of skein-host share. Names, paths and identifiers are bytes, never text.
@0xa64c0e7d9b35f182;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Types = import "types.capnp";

struct Target {
  isIdentifier @0 :Bool;
  text @1 :Data;
}

struct HostItem {
  item @0 :Types.Item;
  path @1 :Data;
  url @2 :Data;
}
