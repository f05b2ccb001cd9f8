#include "linux/protocol/FilesCodec.h"

namespace skein::codec {
namespace {

NSURLPtr urlOf(bool there, capnp::Data::Reader path) {
  return there ? NSURL::fileURLWithPath(text(path)) : nullptr;
}

}  // namespace

void encode(wire::TrashedItem::Builder builder, const TrashedItem& trashed) {
  if (trashed.item) encode(builder.initItem(), *trashed.item);
  if (trashed.url) builder.setUrl(bytes(trashed.url->path()));
  if (trashed.putBackURL) builder.setPutBackURL(bytes(trashed.putBackURL->path()));
  if (trashed.trashed) {
    builder.setHasDate(true);
    builder.setTrashed(moment(*trashed.trashed));
  }
}

TrashedItem decode(wire::TrashedItem::Reader reader) {
  TrashedItem trashed;
  if (reader.hasItem()) trashed.item = decode(reader.getItem());
  trashed.url = urlOf(reader.hasUrl(), reader.getUrl());
  trashed.putBackURL = urlOf(reader.hasPutBackURL(), reader.getPutBackURL());
  if (reader.getHasDate()) trashed.trashed = date(reader.getTrashed());
  return trashed;
}

void encode(wire::TagUse::Builder builder, const TagUse& use) {
  builder.setName(bytes(use.name));
  builder.setItems(use.items);
}

TagUse decode(wire::TagUse::Reader reader) { return {text(reader.getName()), reader.getItems()}; }

void encode(wire::FileHistoryEntry::Builder builder, const FileHistoryEntry& entry) {
  builder.setWhen(moment(entry.when));
  builder.setOperation(bytes(entry.operation));
  builder.setOrigin(bytes(entry.origin));
  builder.setIdentifier(bytes(entry.identifier));
  builder.setPath(bytes(entry.path));
  builder.setDestination(bytes(entry.destination));
  builder.setUndone(entry.undone);
}

FileHistoryEntry decode(wire::FileHistoryEntry::Reader reader) {
  FileHistoryEntry entry;
  entry.when = date(reader.getWhen());
  entry.operation = text(reader.getOperation());
  entry.origin = text(reader.getOrigin());
  entry.identifier = text(reader.getIdentifier());
  entry.path = text(reader.getPath());
  entry.destination = text(reader.getDestination());
  entry.undone = reader.getUndone();
  return entry;
}

}  // namespace skein::codec
