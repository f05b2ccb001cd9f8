#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/foundation/NSURL.h"

namespace skein {

// The key of a share that tells its type; "folder" is significant.
inline constexpr char CKShareTypeKey[] = "cloudkit.type";
// The key of the title that people see who are invited.
inline constexpr char CKShareTitleKey[] = "cloudkit.title";

enum class CKShareParticipantRole : std::uint8_t {
  Unknown = 0,
  Owner = 1,
  PrivateUser = 3,
  PublicUser = 4,
};

enum class CKShareParticipantAcceptanceStatus : std::uint8_t {
  Unknown = 0,
  Pending = 1,
  Accepted = 2,
  Removed = 3,
};

// A signed number, since that is what it is on the wire.
using CKShareParticipantPermission = std::int64_t;
inline constexpr CKShareParticipantPermission CKShareParticipantPermissionUnknown = 0;
inline constexpr CKShareParticipantPermission CKShareParticipantPermissionNone = 1;
inline constexpr CKShareParticipantPermission CKShareParticipantPermissionReadOnly = 2;
inline constexpr CKShareParticipantPermission CKShareParticipantPermissionReadWrite = 3;

struct CKShareParticipant {
  std::string name;
  CKShareParticipantRole role = CKShareParticipantRole::PrivateUser;
  CKShareParticipantAcceptanceStatus acceptanceStatus = CKShareParticipantAcceptanceStatus::Pending;
  CKShareParticipantPermission permission = CKShareParticipantPermissionReadOnly;

  friend bool operator==(const CKShareParticipant&, const CKShareParticipant&) = default;
};

// A record that gives others access to an item, as it was fetched, or as it is to be saved.
// A value: saving it is what changes anything.
struct CKShare {
  // Names what is shared: the item's identifier. It never crosses to a client process, nor
  // comes from one: whoever takes a share from a client sets it to the client's own item.
  std::string rootRecordName;
  std::map<std::string, std::string> values;     // CKShareTypeKey, CKShareTitleKey, others
  std::vector<CKShareParticipant> participants;  // the owner first, once the server knows it
  // Of anybody who has the URL.
  CKShareParticipantPermission publicPermission = CKShareParticipantPermissionNone;
  bool isKnownToServer = false;
  NSURLPtr url;  // null until the server has given one

  // objectForKey: nullptr when there is no such value.
  const std::string* objectForKey(const std::string& key) const {
    const auto found = values.find(key);
    return found == values.end() ? nullptr : &found->second;
  }
};

// A share reference; null is nil.
using CKSharePtr = std::shared_ptr<const CKShare>;

// How the log shows them: "<CKShare document, 2 participants, public 1, known to server>".
std::string description(const CKShare& share);
std::string description(const CKShareParticipant& participant);

}  // namespace skein
