#include "linux/cli/ItemText.h"

#include <array>
#include <cstdio>

#include "platform/fileprovider/FPTags.h"
#include "vellum/VLFileObjectID.h"

namespace skein::cli {
namespace {

std::string jsonDate(std::string_view key, const std::optional<NSDate>& date) {
  if (!date) return {};
  return ",\"" + std::string(key) + "\":\"" + isoDate(*date) + '"';
}

std::string lowercase(std::string_view digits) {
  std::string result(digits);
  for (char& digit : result) {
    if (digit >= 'A' && digit <= 'F') digit = static_cast<char>(digit - 'A' + 'a');
  }
  return result;
}

std::string jsonTags(const NSFileProviderItem& item) {
  std::string json;
  for (const std::string& name : tagsOf(item)) json += (json.empty() ? "" : ",") + jsonString(name);
  return ",\"tags\":[" + json + ']';
}

std::string jsonFlag(std::string_view key, bool value) {
  return ",\"" + std::string(key) + "\":" + (value ? "true" : "false");
}

// Where the contents are: here alone, here and in the cloud, in the cloud alone.
std::string_view stateOf(const NSFileProviderItem& item, std::string_view kind) {
  if (kind != "document") return "-";
  if (!item.isDownloaded()) return "cloud";
  return item.isUploaded() ? "synced" : "local";
}

}  // namespace

std::vector<std::string> tagsOf(const NSFileProviderItem& item) {
  std::vector<std::string> names;
  for (FPTag& tag : FPGetTagsFromTagsData(item.tagData())) names.push_back(std::move(tag.label));
  return names;
}

std::string tagText(const NSFileProviderItem& item) {
  std::string text;
  for (const std::string& name : tagsOf(item)) text += (text.empty() ? "" : ", ") + name;
  return text;
}

std::string pathOfURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  if (url.starts_with(kScheme)) url.remove_prefix(kScheme.size());
  std::string path;
  for (std::size_t at = 0; at < url.size(); ++at) {
    const auto byte =
        url[at] == '%' ? bytesOfHexadecimal(lowercase(url.substr(at + 1, 2))) : std::nullopt;
    // A sign that nothing follows stands for itself.
    const bool isEscaped = byte && !byte->empty();
    path += isEscaped ? byte->front() : url[at];
    if (isEscaped) at += 2;
  }
  return path;
}

std::string_view kindOf(const NSFileProviderItem& item) {
  if (item.isFolder()) return "folder";
  const auto id = VLFileObjectID::fileObjectIDWithString(item.itemIdentifier());
  return id && id->isFolderOrAliasID() ? "alias" : "document";
}

void writeLongLine(Output& output, const NSFileProviderItem& item) {
  const std::string_view kind = kindOf(item);
  const auto size = item.documentSize();
  std::array<char, 64> head{};
  std::snprintf(head.data(), head.size(), "%c %-6s %12s  ",
                kind == "folder" ? 'd' : (kind == "alias" ? 'l' : '-'), stateOf(item, kind).data(),
                size ? std::to_string(*size).c_str() : "-");
  output.write(head.data());
  output.write(localDate(item.contentModificationDate()));
  output.write("  ");
  output.writeName(item.filename(), item.isFolder());
  if (item.favoriteRank()) output.write("  *");
  if (const std::string tags = tagText(item); !tags.empty()) {
    output.write("  [");
    output.writeName(tags);
    output.write("]");
  }
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
  json += jsonTags(item);
  if (const auto rank = item.favoriteRank()) json += ",\"favoriteRank\":" + std::to_string(*rank);
  return json;
}

std::string pathBelow(const std::string& folder, const std::string& name) {
  return folder == "/" ? folder + name : folder + '/' + name;
}

}  // namespace skein::cli
