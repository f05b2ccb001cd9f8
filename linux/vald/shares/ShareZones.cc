// The zones of others, and the questions about an item's sharing.
#include <algorithm>
#include <string_view>
#include <utility>

#include "linux/vald/RandomToken.h"
#include "linux/vald/Replies.h"
#include "linux/vald/WatchScope.h"
#include "linux/vald/shares/Shares.h"
#include "platform/cloudkit/CKError.h"
#include "vellum/VLErrors.h"

namespace skein::vald {

// ---- zones

void Shares::attachZone(NSURLPtr folder, CKRecordZoneID zone,
                        CKShareParticipantPermission permission, Reply<NSErrorPtr> reply) {
  perform(std::move(reply), [folder = std::move(folder), zone = std::move(zone), permission](
                                Shares& self, auto& answered) {
    const auto place = self.placeOf(folder);
    answered(place ? self.attach(*place, zone, permission) : place.error());
  });
}

NSErrorPtr Shares::attach(const SharePlace& place, const CKRecordZoneID& zone,
                          CKShareParticipantPermission permission) {
  if (zone.zoneName.empty() || !isPlainText(zone.zoneName)) {
    return vlc_errorInvalidParameter("zoneName", zone.zoneName);
  }
  if (zone.ownerName.empty() || zone.ownerName == CKCurrentUserDefaultName ||
      !isPlainText(zone.ownerName)) {
    return vlc_errorInvalidParameter("ownerName", zone.ownerName);
  }
  if (permission != CKShareParticipantPermissionReadOnly &&
      permission != CKShareParticipantPermissionReadWrite) {
    return vlc_errorInvalidParameter("permission", std::to_string(permission));
  }
  if (!place.item->isFolder()) {
    return vlc_errorInvalidParameter("folder", place.path + ", which is no folder");
  }
  if (auto reason = whyNotShareable(place)) return refusal(std::move(*reason));
  for (const VLFileObjectID& item : _parts.shared.now()->items) {
    const auto path = _parts.store.pathForID(item, nullptr);
    if (path && pathIsWithin(*path, place.path)) {
      return refusal(*path + " is shared already; a zone's folder holds nothing that is.");
    }
  }
  const auto account = _parts.accounts.current();
  ShareRecord record;
  record.item = place.item->fileObjectID();
  record.ownerName = zone.ownerName;
  record.shareToken = randomToken();
  record.share.url = drawShareURL();
  record.share.values[CKShareTitleKey] = place.item->filename();
  record.share.participants = {{account ? account->name : "", CKShareParticipantRole::PrivateUser,
                                CKShareParticipantAcceptanceStatus::Accepted, permission}};
  record.share = shareToKeep(std::move(record.share), place, zone.ownerName);
  record.share.participants.back().acceptanceStatus = CKShareParticipantAcceptanceStatus::Accepted;
  NSErrorPtr error = _parts.records.putZone({record.item, zone}, record);
  if (error == nullptr) tell(record.item, true);
  return error;
}

void Shares::detachZone(NSURLPtr folder, Reply<NSErrorPtr> reply) {
  perform(std::move(reply), [folder = std::move(folder)](Shares& self, auto& answered) {
    const auto place = self.placeOf(folder);
    if (!place) return answered(place.error());
    if (!place->own || place->own->isOwn()) {
      return answered(
          vlc_errorInvalidParameter("folder", place->path + ", where no zone is attached"));
    }
    NSErrorPtr error = self._parts.records.removeZone(place->own->item);
    if (error == nullptr) self.tell(place->own->item, false);
    answered(error);
  });
}

void Shares::attachedZones(Reply<std::vector<AttachedZone>, NSErrorPtr> reply) {
  perform(std::move(reply), [](Shares& self, auto& answered) {
    const auto zones = self._parts.records.zones();
    if (!zones) return answerError(answered, zones.error());
    std::vector<AttachedZone> attached;
    for (const ZoneRecord& zone : *zones) {
      AttachedZone one;
      if (auto path = self._parts.store.pathForID(zone.folder, nullptr)) {
        one.folder = NSURL::fileURLWithPath(std::move(*path));
      }
      one.zone = zone.zone;
      const auto record = self._parts.records.share(zone.folder);
      if (!record) return answerError(answered, record.error());
      // The owner, and this drive's user.
      if (*record && (*record)->share.participants.size() > 1) {
        one.permission = (*record)->share.participants[1].permission;
      }
      attached.push_back(std::move(one));
    }
    answered(std::move(attached), nullptr);
  });
}

Outcome<Shares::ZoneFinder> Shares::attachedZoneFinder() {
  const auto zones = _parts.records.zones();
  if (!zones) return zones.error();
  std::vector<std::pair<std::string, CKRecordZoneID>> folders;
  for (const ZoneRecord& zone : *zones) {
    if (const auto folder = _parts.store.pathForID(zone.folder, nullptr)) {
      folders.emplace_back(*folder, zone.zone);
    }
  }
  return ZoneFinder([&store = _parts.store, folders = std::move(folders)](VLFileObjectID item) {
    std::optional<CKRecordZoneID> zoneOfItem;
    const auto path = folders.empty() ? std::nullopt : store.pathForID(item, nullptr);
    if (!path) return zoneOfItem;
    for (const auto& [folder, zone] : folders) {
      if (pathIsWithin(*path, folder)) zoneOfItem = zone;
    }
    return zoneOfItem;
  });
}

// ---- questions

void Shares::isShareable(VLFileObjectID item, Reply<bool, NSErrorPtr> reply) {
  perform(std::move(reply), [item](Shares& self, auto& answered) {
    const auto place = self.placeOf(item.asString());
    if (!place) return answerError(answered, place.error());
    answered(!whyNotShareable(*place), nullptr);
  });
}

void Shares::refreshSharingState(NSFileProviderItemIdentifier item, Reply<NSErrorPtr> reply) {
  perform(std::move(reply), [item = std::move(item)](Shares& self, auto& answered) {
    const auto place = self.placeOf(item);
    const auto id = VLFileObjectID::fileObjectIDWithString(item);
    if (place && id) {
      const bool isMarked = self._parts.shared.now()->items.contains(*id);
      if (place->own.has_value() != isMarked) self.tell(*id, place->own.has_value());
    }
    // An item that is not there may be back in a moment: its share stays.
    answered(place.error());
  });
}

void Shares::shareOptions(NSFileProviderItemIdentifier item,
                          Reply<ShareOptions, NSErrorPtr> reply) {
  perform(std::move(reply), [item = std::move(item)](Shares& self, auto& answered) {
    const auto place = self.placeOf(item);
    if (!place) return answerError(answered, place.error());
    ShareOptions options;
    if (place->own) {
      options.flags = options.ownFlags = kHasOwnShare;
      options.publicPermission = place->own->share.publicPermission;
    }
    if (place->above) {
      options.flags |= place->above->isOwn() ? kInSharedFolder : kInFolderOfOthers;
      options.sharedFolder = place->folderAbove.substr(place->folderAbove.rfind('/') + 1);
    }
    answered(std::move(options), nullptr);
  });
}

}  // namespace skein::vald
