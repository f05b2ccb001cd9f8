// The store held against the disk.
#include <cstring>

#include "linux/protocol/AnswerRoom.h"
#include "linux/vald/FolderStore.h"

namespace skein::vald {

std::vector<IndexDifference> FolderStore::check(std::uint64_t limit) {
  using Kind = IndexDifference::Kind;
  // What is under way is no difference.
  settle(std::chrono::seconds(30));
  std::vector<IndexDifference> differences;
  AnswerRoom room(kAnswerBytes);
  bool isFull = false;
  const auto add = [&](Kind kind, const std::string& path, const std::string& detail) {
    if (isFull) return;
    isFull = differences.size() >= limit || !room.take(path.size() + detail.size());
    if (!isFull) {
      differences.push_back({kind, path, detail});
    } else if (!differences.empty()) {
      differences.back().detail += "; there are more differences than are told here";
    }
  };
  auto reader = _readers.lease();
  if (!reader) return differences;
  for (const RootRow& rootRow : reader->roots()) {
    int error = 0;
    const auto root = findRoot(rootRow.path, error);
    if (!root) {
      add(Kind::MissingInStore, rootRow.path, std::strerror(error));
      continue;
    }
    std::vector<std::pair<FolderKey, std::string>> folders{{rootRow.folder, ""}};
    for (const FolderRow& trash : reader->trashes()) {
      if (trash.parent == rootRow.folder) folders.emplace_back(trash.number, trash.name);
    }
    while (!folders.empty() && !isFull) {
      const auto [key, relative] = std::move(folders.back());
      folders.pop_back();
      const auto folder = reader->folder(key);
      if (!folder) continue;
      const std::string path = root->path + (relative.empty() ? "" : '/' + relative);
      FileDescriptor handle;
      Look look = vald::openFolder(*root, relative, relative.empty() ? root->key : folder->key,
                                   handle, error);
      const FolderSnapshot snapshot =
          look == Look::Seen ? readFolder(handle.get(), Detail::Full) : FolderSnapshot{};
      if (look != Look::Seen || snapshot.look != Look::Seen) {
        if (look == Look::Gone) add(Kind::MissingInStore, path, "the folder is gone");
        continue;
      }
      std::vector<ItemRow> rows = reader->children(key);
      std::erase_if(rows, [](const ItemRow& row) { return row.containerID.has_value(); });
      auto row = rows.begin();
      auto entry = snapshot.entries.begin();
      while (row != rows.end() || entry != snapshot.entries.end()) {
        if (entry == snapshot.entries.end() || (row != rows.end() && row->name < entry->name)) {
          add(Kind::MissingInStore, path + '/' + row->name, row->id.asString());
          ++row;
          continue;
        }
        const std::string entryPath = path + '/' + std::string(entry->name);
        if (row == rows.end() || entry->name < row->name) {
          add(Kind::MissingInIndex, entryPath, "the index has no item of this name");
          ++entry;
          continue;
        }
        if (row->state.kind != entry->state.kind || !row->state.key.names(entry->state.key)) {
          add(Kind::Identity, entryPath, "the index knows another file by this name");
        } else if (row->folder == kNoFolder && (row->state.size != entry->state.size ||
                                                row->state.modified != entry->state.modified)) {
          add(Kind::Attributes, entryPath, "size or dates differ");
        }
        if (row->folder != kNoFolder) {
          folders.emplace_back(row->folder,
                               relative.empty() ? row->name : relative + '/' + row->name);
        }
        ++row;
        ++entry;
      }
    }
  }
  return differences;
}

}  // namespace skein::vald
