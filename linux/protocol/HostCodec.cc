#include "linux/protocol/HostCodec.h"

#include "vellum/VLQueryItem.h"

namespace skein::codec {
namespace {

const VLQueryItem* queryItem(const NSFileProviderItemPtr& item) {
  return dynamic_cast<const VLQueryItem*>(item.get());
}

}  // namespace

void encode(wire::Target::Builder builder, const HostTarget& target) {
  builder.setIsIdentifier(target.kind == HostTarget::Kind::Identifier);
  builder.setText(bytes(target.text));
}

HostTarget decode(wire::Target::Reader reader) {
  return {reader.getIsIdentifier() ? HostTarget::Kind::Identifier : HostTarget::Kind::Path,
          text(reader.getText())};
}

void encode(wire::HostItem::Builder builder, const HostItem& item) {
  if (const VLQueryItem* present = queryItem(item.item)) encode(builder.initItem(), *present);
  builder.setPath(bytes(item.path));
  builder.setUrl(bytes(item.url));
}

HostItem decode(wire::HostItem::Reader reader) {
  HostItem item;
  if (reader.hasItem()) item.item = decode(reader.getItem());
  item.path = text(reader.getPath());
  item.url = text(reader.getUrl());
  return item;
}

void encode(wire::Change::Builder builder, const HostChange& change) {
  builder.setKind(static_cast<std::uint8_t>(change.kind));
  builder.setIdentifier(bytes(change.identifier));
  builder.setFilename(bytes(change.filename));
  if (change.previousFilename) builder.setPreviousFilename(bytes(*change.previousFilename));
  if (const VLQueryItem* present = queryItem(change.item)) encode(builder.initItem(), *present);
}

HostChange decode(wire::Change::Reader reader) {
  HostChange change;
  change.kind = enumerator(reader.getKind(), HostChange::Kind::Deleted);
  change.identifier = text(reader.getIdentifier());
  change.filename = text(reader.getFilename());
  if (reader.hasPreviousFilename()) change.previousFilename = text(reader.getPreviousFilename());
  if (reader.hasItem()) change.item = decode(reader.getItem());
  return change;
}

void encode(wire::HostStatus::Builder builder, const HostStatus& status) {
  encode(builder.initDaemon(), status.daemon);
  builder.setProcessID(status.processID);
  builder.setWatchedContainers(status.watchedContainers);
  builder.setDebugLog(status.debugLog);
}

HostStatus decode(wire::HostStatus::Reader reader) {
  HostStatus status;
  status.daemon = decode(reader.getDaemon());
  status.processID = reader.getProcessID();
  status.watchedContainers = reader.getWatchedContainers();
  status.debugLog = reader.getDebugLog();
  return status;
}

void encode(wire::HostDifference::Builder builder, const HostDifference& difference) {
  builder.setKind(static_cast<std::uint8_t>(difference.kind));
  builder.setPath(bytes(difference.path));
  builder.setDetail(bytes(difference.detail));
}

HostDifference decode(wire::HostDifference::Reader reader) {
  return {enumerator(reader.getKind(), HostDifference::Kind::Contents), text(reader.getPath()),
          text(reader.getDetail())};
}

}  // namespace skein::codec
