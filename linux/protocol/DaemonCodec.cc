#include "linux/protocol/DaemonCodec.h"

namespace skein::codec {

void encode(wire::Account::Builder builder, const LocalAccount& account) {
  builder.setName(bytes(account.name));
  if (account.perAppAccountIdentifier) {
    builder.setPerAppAccountIdentifier(bytes(*account.perAppAccountIdentifier));
  }
}

LocalAccount decode(wire::Account::Reader reader) {
  LocalAccount account;
  account.name = text(reader.getName());
  if (reader.hasPerAppAccountIdentifier()) {
    account.perAppAccountIdentifier = text(reader.getPerAppAccountIdentifier());
  }
  return account;
}

void encode(wire::Container::Builder builder, const VLContainer::Properties& container) {
  builder.setContainerID(bytes(container.containerID));
  if (container.documentsURL) builder.setDocumentsURL(bytes(container.documentsURL->path()));
  builder.setDisplayName(bytes(container.displayName));
  if (container.icon) builder.setIcon(bytes(*container.icon));
  builder.setIsIconUndecorated(container.isIconUndecorated);
}

VLContainer::Properties decode(wire::Container::Reader reader) {
  VLContainer::Properties container;
  container.containerID = text(reader.getContainerID());
  if (reader.hasDocumentsURL()) {
    container.documentsURL = NSURL::fileURLWithPath(text(reader.getDocumentsURL()));
  }
  container.displayName = text(reader.getDisplayName());
  if (reader.hasIcon()) container.icon = text(reader.getIcon());
  container.isIconUndecorated = reader.getIsIconUndecorated();
  return container;
}

void encode(wire::Status::Builder builder, const LocalDaemonStatus& status) {
  builder.setStore(bytes(status.store));
  builder.setProcessID(status.processID);
  builder.setDocuments(status.documents);
  builder.setFolders(status.folders);
  builder.setAliases(status.aliases);
  builder.setScan(static_cast<std::uint8_t>(status.scan));
  builder.setScannedFolders(status.scannedFolders);
  builder.setPendingFolders(status.pendingFolders);
  builder.setUnreadableFolders(status.unreadableFolders);
  builder.setWatch(static_cast<std::uint8_t>(status.watch));
  builder.setWatchReason(bytes(status.watchReason));
  builder.setWatches(status.watches);
  builder.setWatchBudget(status.watchBudget);
  builder.setOverflows(status.overflows);
  builder.setRank(status.rank);
  builder.setOldestTokenRank(status.oldestTokenRank);
  builder.setSenders(status.senders);
  if (status.account) encode(builder.initAccount(), *status.account);
  auto notes = builder.initNotes(static_cast<unsigned>(status.notes.size()));
  for (unsigned i = 0; i < notes.size(); ++i) notes.set(i, bytes(status.notes[i]));
}

LocalDaemonStatus decode(wire::Status::Reader reader) {
  LocalDaemonStatus status;
  status.store = text(reader.getStore());
  status.processID = reader.getProcessID();
  status.documents = reader.getDocuments();
  status.folders = reader.getFolders();
  status.aliases = reader.getAliases();
  status.scan = enumerator(reader.getScan(), LocalDaemonStatus::Scan::Rescanning);
  status.scannedFolders = reader.getScannedFolders();
  status.pendingFolders = reader.getPendingFolders();
  status.unreadableFolders = reader.getUnreadableFolders();
  status.watch = enumerator(reader.getWatch(), LocalDaemonStatus::Watch::Degraded);
  status.watchReason = text(reader.getWatchReason());
  status.watches = reader.getWatches();
  status.watchBudget = reader.getWatchBudget();
  status.overflows = reader.getOverflows();
  status.rank = reader.getRank();
  status.oldestTokenRank = reader.getOldestTokenRank();
  status.senders = reader.getSenders();
  if (reader.hasAccount()) status.account = decode(reader.getAccount());
  for (const auto note : reader.getNotes()) status.notes.push_back(text(note));
  return status;
}

void encode(wire::Difference::Builder builder, const IndexDifference& difference) {
  builder.setKind(static_cast<std::uint8_t>(difference.kind));
  builder.setPath(bytes(difference.path));
  builder.setDetail(bytes(difference.detail));
}

IndexDifference decode(wire::Difference::Reader reader) {
  return {enumerator(reader.getKind(), IndexDifference::Kind::Identity), text(reader.getPath()),
          text(reader.getDetail())};
}

void encode(wire::Fault::Builder builder, const FaultInjection& fault) {
  builder.setMethod(bytes(fault.method));
  builder.setAction(static_cast<std::uint8_t>(fault.action));
  builder.setErrorDomain(bytes(fault.errorDomain));
  builder.setErrorCode(fault.errorCode);
  builder.setDelayMilliseconds(fault.delayMilliseconds);
  builder.setTimes(fault.times);
}

FaultInjection decode(wire::Fault::Reader reader) {
  FaultInjection fault;
  fault.method = text(reader.getMethod());
  fault.action = enumerator(reader.getAction(), FaultInjection::Action::Delay);
  fault.errorDomain = text(reader.getErrorDomain());
  fault.errorCode = reader.getErrorCode();
  fault.delayMilliseconds = reader.getDelayMilliseconds();
  fault.times = reader.getTimes();
  return fault;
}

}  // namespace skein::codec
