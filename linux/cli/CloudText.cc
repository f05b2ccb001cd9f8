#include "linux/cli/CloudText.h"

#include <string_view>

#include "linux/cli/Output.h"
#include "linux/cli/Progress.h"

namespace skein::cli {
namespace {

using Uploads = LocalCloudStatus::Uploads;

std::string_view wordOf(Uploads uploads) {
  switch (uploads) {
    case Uploads::Off: return "off";
    case Uploads::Bounded: return "bounded";
    case Uploads::Unlimited: return "unlimited";
    case Uploads::Unasked: return "unasked";
  }
  return "off";
}

}  // namespace

std::string uploadsText(const LocalCloudStatus& cloud) {
  switch (cloud.uploads) {
    case Uploads::Off: return "off";
    case Uploads::Bounded: return "up to " + sizeText(cloud.uploadLimit);
    case Uploads::Unasked: return "none until you agree (skein cloud uploads on)";
    case Uploads::Unlimited: break;
  }
  return cloud.sharesBlocks ? "without limit, sharing the documents' blocks" : "without limit";
}

std::string keepingText(const LocalCloudStatus& cloud) {
  std::string text = std::to_string(cloud.keeping.days) + " days, up to " +
                     sizeText(cloud.keptLimit) + " (" + std::to_string(cloud.keeping.percent) +
                     " % of the disk";
  if (cloud.uploads == Uploads::Bounded) text += ", within the bound of uploads";
  return text + ')';
}

std::string keptText(const LocalCloudStatus& cloud) {
  std::string text = std::to_string(cloud.keptFiles) + ", " + sizeText(cloud.keptBytes);
  if (cloud.onlyCopiesBytes > 0) {
    text += ", of these " + sizeText(cloud.onlyCopiesBytes) +
            " that may be the only copy of an evicted document";
  }
  return text;
}

std::string conditionsText(const LocalCloudConditions& conditions) {
  std::string text;
  const auto add = [&text](const std::string& part) { text += (text.empty() ? "" : ", ") + part; };
  if (conditions.offline) add("offline");
  if (conditions.corrupt) add("corrupt contents");
  if (conditions.quota) add("quota " + sizeText(*conditions.quota));
  if (conditions.delayMilliseconds > 0) {
    add("delay " + std::to_string(conditions.delayMilliseconds) + " ms");
  }
  if (conditions.bytesPerSecond > 0) {
    add("bandwidth " + sizeText(conditions.bytesPerSecond) + "/s");
  }
  if (conditions.failures > 0) {
    add("the next " + std::to_string(conditions.failures) + " transfers fail");
  }
  return text.empty() ? "none" : text;
}

std::string summaryOf(const LocalCloudStatus& cloud) {
  std::string text = sizeText(cloud.usedBytes) + ", uploads " + uploadsText(cloud);
  if (cloud.waiting > 0) text += ", " + std::to_string(cloud.waiting) + " waiting";
  if (cloud.failed > 0) text += ", " + std::to_string(cloud.failed) + " failed";
  if (cloud.leftOut > 0) text += ", " + std::to_string(cloud.leftOut) + " left out";
  if (cloud.conditions != LocalCloudConditions()) {
    text += " (on trial: " + conditionsText(cloud.conditions) + ')';
  }
  return text;
}

std::string jsonOf(const LocalCloudStatus& cloud) {
  const auto flag = [](bool value) { return value ? "true" : "false"; };
  const LocalCloudConditions& conditions = cloud.conditions;
  std::string json =
      "{\"usedBytes\":" + std::to_string(cloud.usedBytes) +
      ",\"keepDays\":" + std::to_string(cloud.keeping.days) +
      ",\"keepPercent\":" + std::to_string(cloud.keeping.percent) +
      ",\"keptLimit\":" + std::to_string(cloud.keptLimit) +
      ",\"keptFiles\":" + std::to_string(cloud.keptFiles) +
      ",\"keptBytes\":" + std::to_string(cloud.keptBytes) +
      ",\"onlyCopiesBytes\":" + std::to_string(cloud.onlyCopiesBytes) +
      ",\"uploads\":" + jsonString(wordOf(cloud.uploads)) + ",\"uploadLimit\":" +
      (cloud.uploads == Uploads::Bounded ? std::to_string(cloud.uploadLimit) : "null") +
      ",\"sharesBlocks\":" + flag(cloud.sharesBlocks) +
      ",\"waiting\":" + std::to_string(cloud.waiting) +
      ",\"failed\":" + std::to_string(cloud.failed) +
      ",\"leftOut\":" + std::to_string(cloud.leftOut) +
      ",\"lastFailure\":" + (cloud.lastFailure.empty() ? "null" : jsonString(cloud.lastFailure));
  return json + ",\"conditions\":{\"offline\":" + flag(conditions.offline) +
         ",\"corrupt\":" + flag(conditions.corrupt) +
         ",\"quota\":" + (conditions.quota ? std::to_string(*conditions.quota) : "null") +
         ",\"delayMilliseconds\":" + std::to_string(conditions.delayMilliseconds) +
         ",\"bytesPerSecond\":" + std::to_string(conditions.bytesPerSecond) +
         ",\"failures\":" + std::to_string(conditions.failures) + "}}";
}

std::string jsonOf(const LocalCloudCollection& collection) {
  return "{\"freedFiles\":" + std::to_string(collection.freedFiles) +
         ",\"freedBytes\":" + std::to_string(collection.freedBytes) +
         ",\"keptFiles\":" + std::to_string(collection.keptFiles) +
         ",\"keptBytes\":" + std::to_string(collection.keptBytes) + "}";
}

}  // namespace skein::cli
