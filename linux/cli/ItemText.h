#pragma once

#include <string>
#include <string_view>

#include "linux/cli/Output.h"
#include "linux/protocol/HostService.h"

namespace skein::cli {

// "folder", "alias" or "document".
std::string_view kindOf(const NSFileProviderItem& item);

// One line of `ls -l`: kind, size, date and name, with its line end.
void writeLongLine(Output& output, const NSFileProviderItem& item);

// The members of an item's JSON object, without its braces. `path` is left out when empty.
std::string jsonMembers(const NSFileProviderItem& item, const std::string& path);

std::string pathBelow(const std::string& folder, const std::string& name);

}  // namespace skein::cli
