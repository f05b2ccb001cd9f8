// The local cloud's state, for people and for programs.
#pragma once

#include <string>

#include "linux/protocol/LocalCloud.h"

namespace skein::cli {

// "up to 1.1 GB", "without limit" or "off"
std::string uploadsText(const LocalCloudStatus& cloud);
// How long, and how much, old revisions and removed documents may stay.
std::string keepingText(const LocalCloudStatus& cloud);
// What of them there is.
std::string keptText(const LocalCloudStatus& cloud);
// What is in force beyond the usual, such as "offline, delay 200 ms"; "none".
std::string conditionsText(const LocalCloudConditions& conditions);

// One line, without its end: uploads, and what waits.
std::string summaryOf(const LocalCloudStatus& cloud);
// A JSON object.
std::string jsonOf(const LocalCloudStatus& cloud);
std::string jsonOf(const LocalCloudCollection& collection);

}  // namespace skein::cli
