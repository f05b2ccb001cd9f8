#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "linux/cli/Output.h"
#include "linux/protocol/HostService.h"

namespace skein::cli {

// "folder", "alias" or "document".
std::string_view kindOf(const NSFileProviderItem& item);

// The names of its tags, in their order; and for people, "home, work".
std::vector<std::string> tagsOf(const NSFileProviderItem& item);
std::string tagText(const NSFileProviderItem& item);

// Of a file URL; empty for an empty one.
std::string pathOfURL(std::string_view url);

// One line of `ls -l`: kind, state, size, date, name and marks, with its line end.
void writeLongLine(Output& output, const NSFileProviderItem& item);

// The members of an item's JSON object, without its braces. `path` is left out when empty.
std::string jsonMembers(const NSFileProviderItem& item, const std::string& path);

std::string pathBelow(const std::string& folder, const std::string& name);

}  // namespace skein::cli
