#include "linux/protocol/CloudCodec.h"

namespace skein::codec {

void encode(wire::CloudConditions::Builder builder, const LocalCloudConditions& conditions) {
  builder.setOffline(conditions.offline);
  builder.setCorrupt(conditions.corrupt);
  builder.setHasQuota(conditions.quota.has_value());
  builder.setQuota(conditions.quota.value_or(0));
  builder.setDelayMilliseconds(conditions.delayMilliseconds);
  builder.setBytesPerSecond(conditions.bytesPerSecond);
  builder.setFailures(conditions.failures);
}

LocalCloudConditions decode(wire::CloudConditions::Reader reader) {
  LocalCloudConditions conditions;
  conditions.offline = reader.getOffline();
  conditions.corrupt = reader.getCorrupt();
  if (reader.getHasQuota()) conditions.quota = reader.getQuota();
  conditions.delayMilliseconds = reader.getDelayMilliseconds();
  conditions.bytesPerSecond = reader.getBytesPerSecond();
  conditions.failures = reader.getFailures();
  return conditions;
}

void encode(wire::CloudStatus::Builder builder, const LocalCloudStatus& status) {
  builder.setUploads(static_cast<std::uint8_t>(status.uploads));
  builder.setUploadLimit(status.uploadLimit);
  builder.setSharesBlocks(status.sharesBlocks);
  builder.setUsedBytes(status.usedBytes);
  builder.setWaiting(status.waiting);
  builder.setFailed(status.failed);
  builder.setLeftOut(status.leftOut);
  builder.setLastFailure(bytes(status.lastFailure));
  encode(builder.initConditions(), status.conditions);
}

LocalCloudStatus decode(wire::CloudStatus::Reader reader) {
  LocalCloudStatus status;
  status.uploads = enumerator(reader.getUploads(), LocalCloudStatus::Uploads::Unasked);
  status.uploadLimit = reader.getUploadLimit();
  status.sharesBlocks = reader.getSharesBlocks();
  status.usedBytes = reader.getUsedBytes();
  status.waiting = reader.getWaiting();
  status.failed = reader.getFailed();
  status.leftOut = reader.getLeftOut();
  status.lastFailure = text(reader.getLastFailure());
  status.conditions = decode(reader.getConditions());
  return status;
}

}  // namespace skein::codec
