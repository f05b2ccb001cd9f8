#include "linux/vald/shares/ShareRules.h"

#include <sys/xattr.h>

#include <algorithm>
#include <array>
#include <set>
#include <string_view>
#include <utility>

#include "linux/vald/RandomToken.h"
#include "platform/cloudkit/CKError.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr std::size_t kMostParticipants = 100;
constexpr std::size_t kMostValues = 32;
constexpr std::size_t kLongestText = 1024;
constexpr char kFolderType[] = "folder";

bool isForbiddenAt(const std::string& path) {
  std::array<char, 8> value{};
  const ssize_t size = lgetxattr(path.c_str(), kShareableAttribute, value.data(), value.size());
  return size == 2 && value[0] == 'n' && value[1] == 'o';
}

// The path of the item or of the nearest folder above it that forbids sharing.
std::optional<std::string> forbiddingPath(const SharePlace& place) {
  std::string path = place.path;
  while (path.size() >= place.root.size()) {
    if (isForbiddenAt(path)) return path;
    const std::size_t slash = path.rfind('/');
    if (slash == std::string::npos || slash == 0) break;
    path.resize(slash);
  }
  return std::nullopt;
}

bool isInTrash(const SharePlace& place) {
  const std::string_view below = std::string_view(place.path).substr(place.root.size());
  return place.item->isTrashed() || below.find("/.Trash-") != std::string_view::npos;
}

std::string quoted(const std::string& text) { return '"' + text + '"'; }

bool isPermission(CKShareParticipantPermission permission) {
  return permission >= CKShareParticipantPermissionNone &&
         permission <= CKShareParticipantPermissionReadWrite;
}

bool isOwner(const CKShareParticipant& participant) {
  return participant.role == CKShareParticipantRole::Owner;
}

std::optional<std::string> whyNotInvited(const CKShareParticipant& participant,
                                         const std::set<std::string>& names) {
  if (participant.name.empty() || !isPlainText(participant.name)) {
    return "A participant needs a name of plain text.";
  }
  if (names.contains(participant.name)) return "The participant is named twice.";
  if (!isPermission(participant.permission)) {
    return "There is no permission " + std::to_string(participant.permission) + ".";
  }
  return std::nullopt;
}

}  // namespace

std::string ownerOf(const ShareRecord& record) {
  return record.share.participants.empty() ? record.ownerName
                                           : record.share.participants.front().name;
}

bool isPlainText(std::string_view text) {
  return text.size() <= kLongestText && std::none_of(text.begin(), text.end(), [](char c) {
           const auto byte = static_cast<unsigned char>(c);
           return byte < 0x20 || byte == 0x7F;
         });
}

NSURLPtr drawShareURL() { return NSURL::URLWithString("skein://share/" + randomToken()); }

NSErrorPtr noShareError(const std::string& name) {
  return NSError::errorWithDomain(VLVellumErrorDomain, VLVellumErrorUnknownShare,
                                  {{NSLocalizedDescriptionKey, quoted(name) + " is not shared."}});
}

NSErrorPtr cloudError(std::int64_t code, std::string text) {
  return NSError::errorWithDomain(CKErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

NSErrorPtr refusal(std::string reason) {
  return cloudError(CKErrorPermissionFailure, std::move(reason));
}

std::string shareTypeOf(const VLQueryItem& item) {
  return item.isFolder() ? kFolderType : item.typeIdentifier().value_or("");
}

std::optional<std::string> whyNotShareable(const SharePlace& place) {
  const VLQueryItem& item = *place.item;
  const std::string name = quoted(item.filename());
  if (place.own && place.own->isOwn()) return std::nullopt;
  if (place.own) return name + " is shared by " + ownerOf(*place.own) + ", who alone can do that.";
  if (item.itemIdentifier() == NSFileProviderRootContainerItemIdentifier) {
    return "The drive itself cannot be shared; share a folder in it.";
  }
  if (isInTrash(place)) return name + " is in the trash; put it back first.";
  if (item.properties().containerID) {
    return name + " is the folder of an app, which cannot be shared; share what is in it.";
  }
  if (item.properties().kind == VLQueryItem::Kind::Alias) {
    return name + " is a reference to another item; share that one.";
  }
  if (place.above) {
    const std::string folder = quoted(place.folderAbove.substr(place.folderAbove.rfind('/') + 1));
    return place.above->isOwn() ? name + " is shared with its folder " + folder + " already."
                                : name + " is in " + folder + " of " + ownerOf(*place.above) +
                                      ", who alone can share it.";
  }
  if (const auto path = forbiddingPath(place)) {
    return "Sharing is forbidden at " + *path + ", which has the extended attribute " +
           kShareableAttribute + " with the value \"no\"; remove that to share " + name + ".";
  }
  return std::nullopt;
}

NSErrorPtr checkShare(const CKShare& share, const SharePlace& place) {
  const std::string* type = share.objectForKey(CKShareTypeKey);
  // A folder's share must say what it is: who may not save those goes by the type.
  if ((type != nullptr && *type == kFolderType) != place.item->isFolder()) {
    return vlc_errorInvalidParameter(CKShareTypeKey, type != nullptr ? *type : "(null)");
  }
  if (share.values.size() > kMostValues) {
    return vlc_errorInvalidParameter("values", std::to_string(share.values.size()) + " of them");
  }
  for (const auto& [key, value] : share.values) {
    if (!isPlainText(key) || !isPlainText(value)) return vlc_errorInvalidParameter(key, value);
  }
  if (!isPermission(share.publicPermission)) {
    return vlc_errorInvalidParameter("publicPermission", std::to_string(share.publicPermission));
  }
  if (share.participants.size() > kMostParticipants) {
    return vlc_errorInvalidParameter("participants",
                                     std::to_string(share.participants.size()) + " of them");
  }
  NSErrorUserInfo failures;
  std::set<std::string> names;
  for (const CKShareParticipant& participant : share.participants) {
    if (isOwner(participant)) continue;
    if (auto reason = whyNotInvited(participant, names)) {
      failures.emplace(CKPartialErrorsByItemIDKeyPrefix + participant.name,
                       vlc_errorInvalidParameter("participant", participant.name + ": " + *reason));
    }
    names.insert(participant.name);
  }
  if (failures.empty()) return nullptr;
  failures.emplace(NSLocalizedDescriptionKey,
                   std::to_string(failures.size()) +
                       " participants cannot be invited, so that nothing was changed.");
  return NSError::errorWithDomain(CKErrorDomain, CKErrorPartialFailure, std::move(failures));
}

CKShare shareToKeep(CKShare share, const SharePlace& place, const std::string& ownerName) {
  const std::vector<CKShareParticipant> before =
      place.own ? place.own->share.participants : std::vector<CKShareParticipant>();
  std::erase_if(share.participants, isOwner);
  for (CKShareParticipant& participant : share.participants) {
    participant.role = CKShareParticipantRole::PrivateUser;
    participant.acceptanceStatus = CKShareParticipantAcceptanceStatus::Pending;
    const auto known = std::find_if(before.begin(), before.end(), [&](const auto& one) {
      return !isOwner(one) && one.name == participant.name;
    });
    if (known != before.end()) participant.acceptanceStatus = known->acceptanceStatus;
  }
  share.participants.insert(
      share.participants.begin(),
      {ownerName, CKShareParticipantRole::Owner, CKShareParticipantAcceptanceStatus::Accepted,
       CKShareParticipantPermissionReadWrite});
  share.rootRecordName = place.item->fileObjectID().asString();
  share.values[CKShareTypeKey] = shareTypeOf(*place.item);
  share.isKnownToServer = true;
  return share;
}

}  // namespace skein::vald
