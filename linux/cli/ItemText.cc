#include "linux/cli/ItemText.h"

#include <array>
#include <cstdio>

#include "vellum/VLFileObjectID.h"

namespace skein::cli {
namespace {

std::string jsonDate(std::string_view key, const std::optional<NSDate>& date) {
  if (!date) return {};
  return ",\"" + std::string(key) + "\":\"" + isoDate(*date) + '"';
}

std::string jsonFlag(std::string_view key, bool value) {
  return ",\"" + std::string(key) + "\":" + (value ? "true" : "false");
}

}  // namespace

std::string_view kindOf(const NSFileProviderItem& item) {
  if (item.isFolder()) return "folder";
  const auto id = VLFileObjectID::fileObjectIDWithString(item.itemIdentifier());
  return id && id->isFolderOrAliasID() ? "alias" : "document";
}

void writeLongLine(Output& output, const NSFileProviderItem& item) {
  const std::string_view kind = kindOf(item);
  const auto size = item.documentSize();
  std::array<char, 64> head{};
  std::snprintf(head.data(), head.size(), "%c %12s  ",
                kind == "folder" ? 'd' : (kind == "alias" ? 'l' : '-'),
                size ? std::to_string(*size).c_str() : "-");
  output.write(head.data());
  output.write(localDate(item.contentModificationDate()));
  output.write("  ");
  output.writeName(item.filename(), item.isFolder());
  output.write("\n");
}

std::string jsonMembers(const NSFileProviderItem& item, const std::string& path) {
  const std::string name = item.filename();
  std::string json = "\"name\":" + jsonString(name) + jsonBytes("name", name);
  if (!path.empty()) json += ",\"path\":" + jsonString(path) + jsonBytes("path", path);
  json += ",\"id\":" + jsonString(item.itemIdentifier());
  json += ",\"parent\":" + jsonString(item.parentItemIdentifier());
  json += ",\"kind\":\"" + std::string(kindOf(item)) + '"';
  if (const auto type = item.typeIdentifier()) json += ",\"type\":" + jsonString(*type);
  if (const auto size = item.documentSize()) json += ",\"size\":" + std::to_string(*size);
  if (const auto count = item.childItemCount()) json += ",\"children\":" + std::to_string(*count);
  json += jsonDate("modified", item.contentModificationDate());
  json += jsonDate("created", item.creationDate());
  json += jsonDate("lastUsed", item.lastUsedDate());
  json += jsonFlag("downloaded", item.isDownloaded()) + jsonFlag("uploaded", item.isUploaded());
  json += jsonFlag("shared", item.isShared()) + jsonFlag("trashed", item.isTrashed());
  return json;
}

std::string pathBelow(const std::string& folder, const std::string& name) {
  return folder == "/" ? folder + name : folder + '/' + name;
}

}  // namespace skein::cli
