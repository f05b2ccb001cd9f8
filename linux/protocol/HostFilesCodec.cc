#include "linux/protocol/HostFilesCodec.h"

namespace skein::codec {

void encode(wire::HostTrashedItem::Builder builder, const HostTrashedItem& trashed) {
  encode(builder.initItem(), trashed.item);
  builder.setPutBackPath(bytes(trashed.putBackPath));
  if (trashed.trashed) {
    builder.setHasDate(true);
    builder.setTrashed(moment(*trashed.trashed));
  }
}

HostTrashedItem decode(wire::HostTrashedItem::Reader reader) {
  HostTrashedItem trashed;
  trashed.item = decode(reader.getItem());
  trashed.putBackPath = text(reader.getPutBackPath());
  if (reader.getHasDate()) trashed.trashed = date(reader.getTrashed());
  return trashed;
}

void encode(wire::HostTransfer::NextResults::Builder builder, const HostTransferStep& step) {
  builder.setCompletedBytes(step.completedBytes);
  builder.setTotalBytes(step.totalBytes);
  builder.setFinished(step.finished);
  encode(builder.initItem(), step.item);
}

HostTransferStep decode(wire::HostTransfer::NextResults::Reader reader) {
  HostTransferStep step;
  step.completedBytes = reader.getCompletedBytes();
  step.totalBytes = reader.getTotalBytes();
  step.finished = reader.getFinished();
  step.item = decode(reader.getItem());
  return step;
}

}  // namespace skein::codec
