#include "linux/vald/shares/Shares.h"

#include <algorithm>
#include <utility>

#include "linux/vald/DrivePath.h"
#include "linux/vald/RandomToken.h"
#include "linux/vald/WatchScope.h"
#include "platform/cloudkit/CKError.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

NSErrorPtr removedMeanwhile() {
  return cloudError(CKErrorUnknownItem, "The share has been removed meanwhile.");
}

}  // namespace

Shares::Shares(SharesParts parts)
    : _parts(std::move(parts)), _queue("vald-shares", _parts.executor) {}

NSErrorPtr Shares::load() {
  const auto shares = _parts.records.shares();
  if (!shares) return shares.error();
  for (const ShareRecord& record : *shares) _parts.shared.add(record.item);
  const auto untold = _parts.records.untold();
  if (!untold) return untold.error();
  for (const VLFileObjectID& item : *untold) {
    _queue.async([self = shared_from_this(), item] {
      self->_parts.store.tellAnew(item, true);
      if (NSErrorPtr error = self->_parts.records.didTell(item)) {
        VL_ERROR(self->_parts.log, "[ERROR] told of a share, but could not note it: %@",
                 error->localizedDescription());
      }
    });
  }
  return nullptr;
}

// ---- places

Outcome<SharePlace> Shares::placeOf(const NSURLPtr& url) {
  if (url == nullptr) return vlc_errorInvalidParameter("url", "(null)");
  std::vector<std::string> roots{_parts.drive};
  for (const StoreRoot& root : _parts.containers.storeRoots()) roots.push_back(root.path);
  if (NSErrorPtr error = checkDrivePath(url->path(), roots)) return error;
  NSErrorPtr error;
  VLQueryItemPtr item = _parts.store.itemAtPath(url->path(), true, &error);
  if (item == nullptr) return error;
  return place(std::move(item), url->path());
}

Outcome<SharePlace> Shares::placeOf(const NSFileProviderItemIdentifier& identifier) {
  if (identifier == NSFileProviderRootContainerItemIdentifier) {
    return placeOf(NSURL::fileURLWithPath(_parts.drive));
  }
  const auto id = VLFileObjectID::fileObjectIDWithString(identifier);
  if (!id) return vlc_errorInvalidParameter("identifier", identifier);
  NSErrorPtr error;
  VLQueryItemPtr item = _parts.store.itemWithID(*id, &error);
  if (item == nullptr) return error;
  auto path = _parts.store.pathForID(*id, &error);
  if (!path) return error;
  return place(std::move(item), std::move(*path));
}

Outcome<SharePlace> Shares::place(VLQueryItemPtr item, std::string path) {
  SharePlace place;
  place.root = _parts.drive;
  for (const StoreRoot& root : _parts.containers.storeRoots()) {
    if (pathIsWithin(path, root.path)) place.root = root.path;
  }
  auto own = _parts.records.share(item->fileObjectID());
  if (!own) return own.error();
  place.own = std::move(*own);
  std::optional<VLFileObjectID> nearest;
  for (const VLFileObjectID& folder : _parts.shared.now()->folders) {
    if (folder == item->fileObjectID()) continue;
    auto above = _parts.store.pathForID(folder, nullptr);
    if (!above || !pathIsWithin(path, *above) || above->size() <= place.folderAbove.size()) {
      continue;
    }
    nearest = folder;
    place.folderAbove = std::move(*above);
  }
  if (nearest) {
    auto above = _parts.records.share(*nearest);
    if (!above) return above.error();
    place.above = std::move(*above);
  }
  place.item = std::move(item);
  place.path = std::move(path);
  return place;
}

// ---- shares

std::shared_ptr<NSProgress> Shares::copyShare(
    NSURLPtr url, Reply<CKSharePtr, std::optional<std::string>, NSErrorPtr> reply) {
  return perform(std::move(reply), [url = std::move(url)](Shares& self, auto& answered) {
    const auto place = self.placeOf(url);
    if (!place) return answerError(answered, place.error());
    const auto& record = place->covering();
    if (!record) return answerError(answered, noShareError(place->item->filename()));
    std::optional<std::string> folder;
    if (!place->own) folder = record->item.asString();
    answered(std::make_shared<const CKShare>(record->share), std::move(folder), nullptr);
  });
}

std::shared_ptr<NSProgress> Shares::newShare(NSURLPtr url, ShareReply reply) {
  return perform(std::move(reply), [url = std::move(url)](Shares& self, auto& answered) {
    const auto place = self.placeOf(url);
    if (!place) return answerError(answered, place.error());
    if (auto reason = whyNotShareable(*place)) {
      return answerError(answered, refusal(std::move(*reason)));
    }
    CKShare share;
    share.rootRecordName = place->item->fileObjectID().asString();
    share.values = {{CKShareTypeKey, shareTypeOf(*place->item)},
                    {CKShareTitleKey, place->item->filename()}};
    answered(std::make_shared<const CKShare>(std::move(share)), nullptr);
  });
}

std::shared_ptr<NSProgress> Shares::copyShareURL(NSURLPtr url, Reply<NSURLPtr, NSErrorPtr> reply) {
  return perform(std::move(reply), [url = std::move(url)](Shares& self, auto& answered) {
    const auto place = self.placeOf(url);
    if (!place) return answerError(answered, place.error());
    if (const auto& record = place->covering()) return answered(record->share.url, nullptr);
    if (auto reason = whyNotShareable(*place)) {
      return answerError(answered, refusal(std::move(*reason)));
    }
    CKShare share;
    share.values[CKShareTitleKey] = place->item->filename();
    const auto kept = self.keep(std::move(share), *place);
    if (!kept) return answerError(answered, kept.error());
    answered(kept->share.url, nullptr);
  });
}

std::shared_ptr<NSProgress> Shares::saveShare(CKShare share, ShareReply reply) {
  return perform(std::move(reply), [share = std::move(share)](Shares& self, auto& answered) {
    const auto place = self.placeOf(share.rootRecordName);
    if (!place) return answerError(answered, place.error());
    if (share.isKnownToServer && !place->own) return answerError(answered, removedMeanwhile());
    auto reason = whyNotShareable(*place);
    if (reason) return answerError(answered, refusal(std::move(*reason)));
    if (!share.isKnownToServer && place->own) {
      return answerError(answered, cloudError(CKErrorServerRecordChanged,
                                              "The item has been shared meanwhile; fetch its "
                                              "share and change that."));
    }
    if (NSErrorPtr error = checkShare(share, *place)) return answerError(answered, error);
    const auto kept = self.keep(share, *place);
    if (!kept) return answerError(answered, kept.error());
    answered(std::make_shared<const CKShare>(kept->share), nullptr);
  });
}

Outcome<ShareRecord> Shares::keep(CKShare share, const SharePlace& place) {
  ShareRecord record;
  std::string ownerName;
  if (place.own) {
    record = *place.own;
    ownerName = ownerOf(record);
  } else {
    record.item = place.item->fileObjectID();
    record.shareToken = randomToken();
    record.share.url = drawShareURL();
    if (const auto account = _parts.accounts.current()) ownerName = account->name;
  }
  share.url = record.share.url;
  record.share = shareToKeep(std::move(share), place, ownerName);
  if (NSErrorPtr error = _parts.records.put(record)) return error;
  if (!record.item.isFolderOrAliasID() && _parts.writeHint) {
    _parts.writeHint(place.path, record.item.rawID());
  }
  tell(record.item, true);
  return record;
}

Outcome<ShareRecord> Shares::ownShareToChange(const CKShare& share) {
  const auto item = VLFileObjectID::fileObjectIDWithString(share.rootRecordName);
  if (!item) return vlc_errorInvalidParameter("rootRecordName", share.rootRecordName);
  const auto record = _parts.records.share(*item);
  if (!record) return record.error();
  if (!*record) return removedMeanwhile();
  if (!(*record)->isOwn()) {
    return refusal("The share is " + ownerOf(**record) + "'s, who alone can change it.");
  }
  return **record;
}

std::shared_ptr<NSProgress> Shares::destroyShare(CKShare share, Reply<NSErrorPtr> reply) {
  return perform(std::move(reply), [share = std::move(share)](Shares& self, auto& answered) {
    const auto record = self.ownShareToChange(share);
    if (!record) return answered(record.error());
    NSErrorPtr error = self._parts.records.remove(record->item);
    if (error == nullptr) self.tell(record->item, false);
    answered(error);
  });
}

std::shared_ptr<NSProgress> Shares::copyShareTokens(
    NSURLPtr url, Reply<std::optional<std::string>, std::optional<std::string>, NSErrorPtr> reply) {
  return perform(std::move(reply), [url = std::move(url)](Shares& self, auto& answered) {
    const auto place = self.placeOf(url);
    if (!place) return answerError(answered, place.error());
    const auto& record = place->covering();
    if (!record) return answerError(answered, noShareError(place->item->filename()));
    auto base = self._parts.records.baseToken(place->item->fileObjectID());
    if (!base) return answerError(answered, base.error());
    answered(record->shareToken, std::move(*base), nullptr);
  });
}

void Shares::answerInvitation(NSURLPtr shareURL, std::string participant, bool accepts,
                              Reply<NSErrorPtr> reply) {
  perform(std::move(reply), [shareURL = std::move(shareURL), participant = std::move(participant),
                             accepts](Shares& self, auto& answered) {
    if (shareURL == nullptr) return answered(vlc_errorInvalidParameter("shareURL", "(null)"));
    const auto item = self._parts.records.itemOfURL(shareURL->absoluteString());
    if (!item) return answered(item.error());
    if (!*item) return answered(cloudError(CKErrorUnknownItem, "No share has this URL."));
    auto record = self._parts.records.share(**item);
    if (!record) return answered(record.error());
    if (!*record) return answered(removedMeanwhile());
    auto& participants = (*record)->share.participants;
    const auto found = std::find_if(participants.begin(), participants.end(), [&](const auto& one) {
      return one.role != CKShareParticipantRole::Owner && one.name == participant;
    });
    if (found == participants.end()) {
      return answered(cloudError(CKErrorUnknownItem, participant + " was not invited."));
    }
    found->acceptanceStatus = accepts ? CKShareParticipantAcceptanceStatus::Accepted
                                      : CKShareParticipantAcceptanceStatus::Removed;
    NSErrorPtr error = self._parts.records.put(**record);
    if (error == nullptr) self.tell(**item, true);
    answered(error);
  });
}

// ---- telling

void Shares::tell(VLFileObjectID item, bool isShared) {
  const bool wasShared = _parts.shared.now()->items.contains(item);
  if (isShared) {
    _parts.shared.add(item);
  } else {
    _parts.shared.remove(item);
  }
  _parts.store.tellAnew(item, isShared != wasShared);
  if (NSErrorPtr error = _parts.records.didTell(item)) {
    VL_ERROR(_parts.log, "[ERROR] told of a share, but could not note it: %@",
             error->localizedDescription());
  }
}

void Shares::coverageDidChange(VLFileObjectID folder) {
  _queue.async([self = shared_from_this(), folder] { self->_parts.store.tellAnew(folder, true); });
}

}  // namespace skein::vald
