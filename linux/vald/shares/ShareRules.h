#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "linux/vald/shares/ShareRecords.h"
#include "vellum/VLQueryItem.h"

namespace skein::vald {

// A person who will not have something shared says so with this extended attribute on it, or
// on a folder above it, and the value "no".
inline constexpr char kShareableAttribute[] = "user.skein.shareable";

// An item with what its sharing depends on.
struct SharePlace {
  VLQueryItemPtr item;
  std::string path;  // absolute
  std::string root;  // the path of the drive's folder, or the app container's, that it is in
  std::optional<ShareRecord> own;    // its own share
  std::optional<ShareRecord> above;  // that of the nearest shared folder above it
  std::string folderAbove;           // that folder's path

  const std::optional<ShareRecord>& covering() const { return own ? own : above; }
};

// Why the item cannot be shared by this drive's user, in words; nil when it can. Looks at the
// attributes of the item and of the folders above it.
std::optional<std::string> whyNotShareable(const SharePlace& place);

// What is wrong with a share that is to be saved for the item; null when nothing is. Some
// participants that cannot be invited are a partial failure.
NSErrorPtr checkShare(const CKShare& share, const SharePlace& place);

// `share` as it is kept: with the item, its type, the owner first, and the answers that the
// participants have given to the share that was there.
CKShare shareToKeep(CKShare share, const SharePlace& place, const std::string& ownerName);

// The type of a share of the item: "folder", or the document's content type.
std::string shareTypeOf(const VLQueryItem& item);

// Whose share it is, by name.
std::string ownerOf(const ShareRecord& record);

// Without control characters, and not too long.
bool isPlainText(std::string_view text);
// An address that nobody can guess.
NSURLPtr drawShareURL();

// VLVellumErrorUnknownShare.
NSErrorPtr noShareError(const std::string& name);
// In CKErrorDomain.
NSErrorPtr cloudError(std::int64_t code, std::string text);
// CKErrorPermissionFailure.
NSErrorPtr refusal(std::string reason);

}  // namespace skein::vald
