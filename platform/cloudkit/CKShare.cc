#include "platform/cloudkit/CKShare.h"

namespace skein {

std::string description(const CKShare& share) {
  const std::string* type = share.objectForKey(CKShareTypeKey);
  return "<CKShare " + (type != nullptr ? *type : "(null)") + ", " +
         std::to_string(share.participants.size()) + " participants, public " +
         std::to_string(share.publicPermission) +
         (share.isKnownToServer ? ", known to server>" : ", new>");
}

std::string description(const CKShareParticipant& participant) {
  return "<CKShareParticipant \"" + participant.name + "\" role " +
         std::to_string(static_cast<int>(participant.role)) + ", status " +
         std::to_string(static_cast<int>(participant.acceptanceStatus)) + ", permission " +
         std::to_string(participant.permission) + ">";
}

}  // namespace skein
