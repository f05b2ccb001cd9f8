// Feeds what is read from files, attributes and tokens that others write. The first byte of an
// input chooses the reader; what a reader accepts must survive being written and read again.
#include <stdlib.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>

#include "linux/desktop/DesktopEntries.h"
#include "linux/framework/LocalDefaults.h"
#include "linux/vald/ChangeToken.h"
#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/TagAttributes.h"
#include "linux/vald/files/TrashInfo.h"
#include "support/NSData+Additions.h"
#include "vellum/VLContainer.h"

namespace skein {
namespace {

namespace fs = std::filesystem;

#define REQUIRE(condition) \
  if (!(condition)) abort()

// In memory; gone with the process.
class Folder {
 public:
  Folder() { REQUIRE(mkdtemp(_name) != nullptr); }
  ~Folder() { fs::remove_all(_name); }
  std::string at(const std::string& name) const { return std::string(_name) + "/" + name; }

 private:
  char _name[32] = "/dev/shm/skein-fuzz-XXXXXX";
};

const Folder& folder() {
  static const Folder folder;
  return folder;
}

void marker(const std::string& text) {
  using namespace vald;
  if (const auto parsed = EvictionMarker::parse(text)) {
    REQUIRE(parsed->mode <= 0777);
    REQUIRE(text.starts_with(parsed->sealed));
    REQUIRE(!parsed->name || refusalOfName(*parsed->name, false) == nullptr);
    const std::string written = parsed->asText();
    const auto again = EvictionMarker::parse(written);
    REQUIRE(again && again->asText() == written);
  }
  const FileDescriptor file(memfd_create("fuzz", MFD_CLOEXEC));
  REQUIRE(::write(file.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size()));
  readMarkerText(file.get());
  if (refusalOfName(text, false) == nullptr) {
    const MarkerNames names(text);
    for (const std::string& name : {names.marker, names.part, names.fresh, names.aside}) {
      REQUIRE(refusalOfName(name, false) == nullptr || name.size() <= 255);
    }
    REQUIRE(names.shortened || documentNameOfMarker(names.marker) == text);
  }
  if (mayBeMarkerName(text)) REQUIRE(!documentNameOfMarker(text).empty());
  isCloudTemporaryName(text);
}

void trashInfo(const std::string& text) {
  using namespace vald;
  if (const auto info = parseTrashInfo(text)) {
    REQUIRE(!info->path.empty() && info->path.find('\0') == std::string::npos);
    const auto again = parseTrashInfo(trashInfoText(*info));
    REQUIRE(again && again->path == info->path && again->deletionDate == info->deletionDate);
  }
  if (text.find('\0') == std::string::npos) {
    REQUIRE(percentDecoded(percentEncoded(text)) == text);
  }
  if (const auto place = trashedPath(text)) REQUIRE(isTrashName(pathComponents(text).front()));
}

void tags(const std::string& text) {
  using namespace vald;
  const std::vector<std::string> names = splitTags(text);
  REQUIRE(std::set(names.begin(), names.end()).size() == names.size());
  REQUIRE(splitTags(joinTags(names)) == names);
  refusalOfTags(names);
  refusalOfTags({text});
}

void hint(const std::string& text) {
  const auto hint = vald::DocumentHint::parse(text);
  if (hint) REQUIRE(hint->document != 0 && hint->asText() == text);
}

void tokens(const std::string& text) {
  const NSData data{std::string_view(text)};
  const std::uint8_t order = vl_pageTokenSortOrder(data);
  const std::uint64_t offset = vl_pageTokenOffset(data);
  if (const auto page = vl_pageTokenFromSortOrder(order, offset)) {
    REQUIRE(vl_pageTokenSortOrder(page) == order && vl_pageTokenOffset(page) == offset);
  }
  uuid_t uuid{};
  for (std::size_t at = 0; at < uuid.size() && at + 8 < text.size(); ++at) {
    uuid[at] = static_cast<std::uint8_t>(text[at + 8]);
  }
  const std::int64_t rank = vl_changeTokenRankWithUUID(data, uuid);
  REQUIRE(vl_changeTokenRankWithUUID(vl_changeTokenFromRank(static_cast<std::uint64_t>(rank), uuid),
                                     uuid) == rank);
  const std::string journal = "7d0c5f0e-7a55-4e0f-9a51-0a5b9f9a2f11";
  if (const auto known = vald::rankOfChangeToken(data, journal)) {
    REQUIRE(vald::changeTokenFromRank(*known, journal).isEqualToData(data));
  }
}

// Up to three entries, parted by NULs.
void desktopEntries(const std::string& text) {
  const std::string entries = folder().at("applications");
  fs::remove_all(entries);
  fs::create_directories(entries + "/below");
  const char* const names[] = {"a", "below/b", "c"};
  std::size_t at = 0;
  for (const char* name : names) {
    const std::size_t end = std::min(text.find('\0', at), text.size());
    std::ofstream(entries + "/" + name + ".desktop") << text.substr(at, end - at);
    at = std::min(end + 1, text.size());
  }
  std::set<std::string> displayNames;
  for (const AppContainer& container : appContainersInFolders({entries})) {
    REQUIRE(isAppContainerID(container.containerID));
    // It stands in the drive's root under this name.
    REQUIRE(vald::refusalOfName(container.displayName, false) == nullptr);
    REQUIRE(displayNames.insert(container.displayName).second);
  }
  for (const char* name : {"a", "below-b", "c"}) appInFolders({entries}, name);
}

void settings(const std::string& text) {
  const std::string path = folder().at("settings.ini");
  std::ofstream(path) << text;
  LocalDefaults(path).minFileSizeForThumbnailTransfer();
}

constexpr void (*kReaders[])(const std::string&) = {marker, trashInfo,      tags,    hint,
                                                    tokens, desktopEntries, settings};

}  // namespace
}  // namespace skein

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::string text(reinterpret_cast<const char*>(data + 1), size - 1);
  skein::kReaders[data[0] % std::size(skein::kReaders)](text);
  return 0;
}
