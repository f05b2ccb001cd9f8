#pragma once

#include <cstdint>

namespace skein {

inline constexpr char CKErrorDomain[] = "CKErrorDomain";

// Codes of CKErrorDomain.
inline constexpr std::int64_t CKErrorPartialFailure = 2;
inline constexpr std::int64_t CKErrorNetworkUnavailable = 3;
inline constexpr std::int64_t CKErrorPermissionFailure = 10;
inline constexpr std::int64_t CKErrorUnknownItem = 11;
inline constexpr std::int64_t CKErrorServerRecordChanged = 14;
inline constexpr std::int64_t CKErrorOperationCancelled = 20;

// A partial failure's errors, one entry of its user information for each record: the key is
// this and the record's name.
inline constexpr char CKPartialErrorsByItemIDKeyPrefix[] = "CKPartialErrors/";

}  // namespace skein
