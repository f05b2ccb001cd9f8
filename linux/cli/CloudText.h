// The local cloud's state, for people and for programs.
#pragma once

#include <string>

#include "linux/protocol/LocalCloud.h"

namespace skein::cli {

// "up to 1.1 GB", "without limit" or "off"
std::string uploadsText(const LocalCloudStatus& cloud);
// What is in force beyond the usual, such as "offline, delay 200 ms"; "none".
std::string conditionsText(const LocalCloudConditions& conditions);

// One line, without its end: uploads, and what waits.
std::string summaryOf(const LocalCloudStatus& cloud);
// A JSON object.
std::string jsonOf(const LocalCloudStatus& cloud);

}  // namespace skein::cli
