#include "linux/vald/scan/Details.h"

#include <sys/xattr.h>

#include <cerrno>

#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/TagAttributes.h"

namespace skein::vald {

std::string Details::pathOf(const ItemRow& row) {
  int folder = -1;
  int error = 0;
  if (_disk.open(row.parent, folder, error) != Look::Seen) return {};
  const std::string name = row.state.isEvicted ? MarkerNames(row.name).marker : row.name;
  return "/proc/self/fd/" + std::to_string(folder) + '/' + name;
}

bool Details::mayHaveAttributes(const ItemRow& row) {
  if (row.state.kind == ItemKind::Alias || row.containerID) return false;
  if (row.state.isEvicted) return true;
  const std::string path = pathOf(row);
  return !path.empty() && llistxattr(path.c_str(), nullptr, 0) > 0;
}

Details::Read Details::read(const ItemRow& row, const char* attribute, std::string& value) {
  // The system says of every link that it has no attributes; the index keeps its tags.
  if (row.state.kind == ItemKind::Alias || row.containerID) return Read::Unknown;
  const std::string path = pathOf(row);
  if (path.empty()) return Read::Unknown;
  char few[512];
  ssize_t size = lgetxattr(path.c_str(), attribute, few, sizeof few);
  if (size >= 0) {
    value.assign(few, static_cast<std::size_t>(size));
    return Read::Value;
  }
  if (errno == ENODATA) return Read::Absent;
  if (errno != ERANGE) return Read::Unknown;
  value.resize(std::size_t{64} << 10);
  size = lgetxattr(path.c_str(), attribute, value.data(), value.size());
  if (size < 0) return Read::Unknown;
  value.resize(static_cast<std::size_t>(size));
  return Read::Value;
}

bool Details::refresh(ItemRow& row, bool isSameFile) {
  std::string tags;
  const Read look = read(row, kTagsAttribute, tags);
  const bool mayKeep =
      look == Read::Unknown && !(row.state.isEvicted && row.state.markedBirth != 0);
  if (mayKeep || (look == Read::Absent && !row.hasDetails && !row.state.isEvicted)) return false;
  const ItemDetails before = row.hasDetails ? _index.details(row.id) : ItemDetails();
  ItemDetails now = before;
  if (look == Read::Value) {
    now.tags = joinTags(splitTags(tags));
    now.tagsAreOnFile = !now.tags.empty();
  } else if (look == Read::Absent) {
    if (isSameFile && now.tagsAreOnFile) now.tags.clear();
    now.tagsAreOnFile = false;
  }
  if (row.state.isEvicted && row.state.markedBirth != 0 && !now.created) {
    now.created = row.state.markedBirth;
  }
  if (now == before) return false;
  put(row, now);
  return true;
}

void Details::put(ItemRow& row, const ItemDetails& details) {
  _index.putDetails(row.id, details);
  row.hasDetails = !details.isEmpty();
}

std::optional<VLFileObjectID> Details::hinted(const ItemRow& row, bool& waits) {
  waits = false;
  if (row.state.kind != ItemKind::Document) return std::nullopt;
  std::uint64_t document = row.state.markedDocument;
  bool isOwn = true;
  std::string text;
  if (document == 0 && read(row, kHintAttribute, text) == Read::Value) {
    const auto hint = DocumentHint::parse(text);
    if (hint) {
      const FileKey& key = row.state.key;
      document = hint->document;
      isOwn = hint->inode == key.inode &&
              (hint->generation == 0 || key.generation == 0 || hint->generation == key.generation);
    }
  }
  if (document == 0) return std::nullopt;
  const auto id = VLFileObjectID::documentWithRawID(document);
  if (_index.rowWithID(id)) return std::nullopt;
  waits = !isOwn && _expectsMore;
  return waits ? std::nullopt : std::optional(id);
}

}  // namespace skein::vald
