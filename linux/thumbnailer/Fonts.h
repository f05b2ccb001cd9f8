#pragma once

#include <string>
#include <vector>

namespace skein::thumbnailer {

// Makes fontconfig read its rules and caches, which it then keeps as they are. The folders
// that fonts are read from when a page needs them, and those of the tables that PDF text in
// other scripts needs. Empty: there are no fonts. Once.
std::vector<std::string> prepareFonts();

}  // namespace skein::thumbnailer
