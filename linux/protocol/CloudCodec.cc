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

void encode(wire::CloudKeeping::Builder builder, const LocalCloudKeeping& keeping) {
  builder.setDays(keeping.days);
  builder.setPercent(keeping.percent);
}

LocalCloudKeeping decode(wire::CloudKeeping::Reader reader) {
  return {reader.getDays(), reader.getPercent()};
}

void encode(wire::CloudCollection::Builder builder, const LocalCloudCollection& collection) {
  builder.setFreedFiles(collection.freedFiles);
  builder.setFreedBytes(collection.freedBytes);
  builder.setKeptFiles(collection.keptFiles);
  builder.setKeptBytes(collection.keptBytes);
}

LocalCloudCollection decode(wire::CloudCollection::Reader reader) {
  return {reader.getFreedFiles(), reader.getFreedBytes(), reader.getKeptFiles(),
          reader.getKeptBytes()};
}

void encode(wire::CloudVerification::Builder builder, const LocalCloudVerification& verification) {
  auto list = builder.initFaults(static_cast<unsigned>(verification.faults.size()));
  unsigned at = 0;
  for (const LocalCloudFault& fault : verification.faults) {
    list[at].setPath(bytes(fault.path));
    list[at++].setWhy(bytes(fault.why));
  }
  builder.setDone(verification.done);
  builder.setBytes(verification.bytes);
}

LocalCloudVerification decode(wire::CloudVerification::Reader reader) {
  LocalCloudVerification verification;
  for (const auto fault : reader.getFaults()) {
    verification.faults.push_back({text(fault.getPath()), text(fault.getWhy())});
  }
  verification.done = reader.getDone();
  verification.bytes = reader.getBytes();
  return verification;
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
  encode(builder.initKeeping(), status.keeping);
  builder.setKeptLimit(status.keptLimit);
  builder.setKeptFiles(status.keptFiles);
  builder.setKeptBytes(status.keptBytes);
  builder.setOnlyCopiesBytes(status.onlyCopiesBytes);
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
  status.keeping = decode(reader.getKeeping());
  status.keptLimit = reader.getKeptLimit();
  status.keptFiles = reader.getKeptFiles();
  status.keptBytes = reader.getKeptBytes();
  status.onlyCopiesBytes = reader.getOnlyCopiesBytes();
  return status;
}

}  // namespace skein::codec
