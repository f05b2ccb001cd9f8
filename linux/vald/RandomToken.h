#pragma once

#include <string>

namespace skein::vald {

// 32 hexadecimal digits that nobody can guess.
std::string randomToken();

}  // namespace skein::vald
