#pragma once

#include <cstdint>

namespace skein {

// How a reader wants to find a file, as bits. Bits that are not named here are passed on
// as they are.
using NSFileCoordinatorReadingOptions = std::uint64_t;

inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingWithoutChanges = 1 << 0;
inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingResolvesSymbolicLink =
    1 << 1;
inline constexpr NSFileCoordinatorReadingOptions
    NSFileCoordinatorReadingImmediatelyAvailableMetadataOnly = 1 << 2;
inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingForUploading = 1 << 3;
// The contents are fetched also when the file is present already.
inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingAlwaysFetches = 1 << 17;

}  // namespace skein
