#include "tests/vald/StoreFixture.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>

namespace skein::vald {

using namespace std::chrono_literals;

void SilentLog::write(LogType, std::string_view line) {
  MutexLock lock(_mutex);
  _lines += line;
  _lines += '\n';
}

bool SilentLog::holds(std::string_view text) const {
  MutexLock lock(_mutex);
  return _lines.find(text) != std::string::npos;
}

void RecordingListener::storeDidChange(const std::vector<StoreChange>& changes) {
  MutexLock lock(_mutex);
  _changes.insert(_changes.end(), changes.begin(), changes.end());
}

void RecordingListener::storeDidOverflow(std::optional<VLFileObjectID>) {}

std::vector<StoreChange> RecordingListener::take() {
  MutexLock lock(_mutex);
  return std::exchange(_changes, {});
}

void StoreFixture::SetUp() {
  const char* folder = std::getenv("TMPDIR");
  std::string pattern = std::string(folder != nullptr ? folder : "/tmp") + "/skein-store-XXXXXX";
  ASSERT_NE(mkdtemp(pattern.data()), nullptr);
  _base = pattern;
  root = _base + "/drive";
  std::filesystem::create_directory(root);
  options.databasePath = _base + "/index.db";
  options.drive.path = root;
}

void StoreFixture::TearDown() {
  close();
  std::filesystem::remove_all(_base);
}

void StoreFixture::open() {
  NSErrorPtr error;
  store = FolderStore::openFolder(options, listener, log, &error);
  ASSERT_NE(store, nullptr) << (error ? error->localizedDescription() : "");
  settle();
}

void StoreFixture::reopen() {
  close();
  open();
}

void StoreFixture::settle() { ASSERT_TRUE(store->settle(60s)); }

void StoreFixture::write(const std::string& path, const std::string& text) {
  std::FILE* file = std::fopen(at(path).c_str(), "w");
  ASSERT_NE(file, nullptr) << path;
  std::fputs(text.c_str(), file);
  std::fclose(file);
}

void StoreFixture::rename(const std::string& from, const std::string& to) {
  ASSERT_EQ(::rename(at(from).c_str(), at(to).c_str()), 0) << from;
}

void StoreFixture::exchange(const std::string& a, const std::string& b) {
  ASSERT_EQ(renameat2(AT_FDCWD, at(a).c_str(), AT_FDCWD, at(b).c_str(), RENAME_EXCHANGE), 0);
}

void StoreFixture::link(const std::string& from, const std::string& to) {
  ASSERT_EQ(::link(at(from).c_str(), at(to).c_str()), 0);
}

void StoreFixture::remove(const std::string& path) {
  ASSERT_GT(std::filesystem::remove_all(at(path)), 0U) << path;
}

void StoreFixture::makeFolder(const std::string& path) {
  ASSERT_TRUE(std::filesystem::create_directories(at(path))) << path;
}

VLQueryItemPtr StoreFixture::item(const std::string& path) {
  return store->itemAtPath(path.empty() ? root : at(path), false, nullptr);
}

std::string StoreFixture::id(const std::string& path) {
  const VLQueryItemPtr found = item(path);
  return found ? found->fileObjectID().asString() : "";
}

StoreFixture::Tree StoreFixture::listed() {
  Tree tree;
  std::vector<std::optional<VLFileObjectID>> folders{std::nullopt};
  while (!folders.empty()) {
    const auto folder = folders.back();
    folders.pop_back();
    std::uint64_t offset = 0;
    do {
      NSErrorPtr error;
      const Page page = store->listFolder(folder, SortOrder::Name, offset, 5, &error);
      EXPECT_EQ(error, nullptr);
      for (const VLQueryItemPtr& item : page.items) {
        tree[item->fileObjectID().asString()] =
            item->parentItemIdentifier() + '/' + item->filename();
        if (item->isFolder()) folders.emplace_back(item->fileObjectID());
      }
      offset = page.nextOffset;
    } while (offset != 0);
  }
  return tree;
}

bool StoreFixture::replay(Tree& tree, std::uint64_t& rank, std::uint64_t limit) {
  for (;;) {
    NSErrorPtr error;
    const ChangePage page = store->changesSince(rank, limit, &error);
    EXPECT_EQ(error, nullptr);
    if (page.expired) return false;
    if (page.changes.empty()) return true;
    for (const StoreChange& change : page.changes) {
      EXPECT_GT(change.rank, rank);
      rank = change.rank;
      const std::string id = change.item->fileObjectID().asString();
      if (change.item->isDead()) {
        tree.erase(id);
      } else {
        tree[id] = change.item->parentItemIdentifier() + '/' + change.item->filename();
      }
    }
    EXPECT_EQ(page.newestRank, rank);
  }
}

}  // namespace skein::vald
