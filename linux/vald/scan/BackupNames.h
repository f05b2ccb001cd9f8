#pragma once

#include <string_view>

namespace skein::vald {

// Whether `name` is what programs call the earlier version of `original` while they save:
// "X~", "X.~1~", "X.bak", "#X#", ".X.swp" and their kin, or a temporary name of any kind.
bool isBackupNameOf(std::string_view name, std::string_view original);

}  // namespace skein::vald
