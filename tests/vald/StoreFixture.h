// A real store over a real temporary folder, and the system calls that programs save with.
#pragma once

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/FolderStore.h"

namespace skein::vald {

class SilentLog final : public Log {
 public:
  void write(LogType type, std::string_view line) override SKEIN_EXCLUDES(_mutex);
  bool holds(std::string_view text) const SKEIN_EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  std::string _lines SKEIN_GUARDED_BY(_mutex);
};

// Keeps what the store told.
class RecordingListener final : public StoreListener {
 public:
  void storeDidChange(const std::vector<StoreChange>& changes) override SKEIN_EXCLUDES(_mutex);
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override SKEIN_EXCLUDES(_mutex);
  std::vector<StoreChange> take() SKEIN_EXCLUDES(_mutex);

 private:
  Mutex _mutex;
  std::vector<StoreChange> _changes SKEIN_GUARDED_BY(_mutex);
};

class StoreFixture : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // Opens the store and waits until its first scan is done.
  void open();
  void close() { store.reset(); }
  void reopen();
  void settle();

  // Paths are relative to the drive's folder.
  std::string at(const std::string& path) const { return root + '/' + path; }
  void write(const std::string& path, const std::string& text = "x");
  void rename(const std::string& from, const std::string& to);
  void exchange(const std::string& a, const std::string& b);
  void link(const std::string& from, const std::string& to);
  void remove(const std::string& path);
  void makeFolder(const std::string& path);

  // The item at a path as the index knows it; null when there is none.
  VLQueryItemPtr item(const std::string& path);
  // Its identifier; empty when there is none.
  std::string id(const std::string& path);
  // Every item by identifier: its folder's identifier and its name. By listing, and by the
  // journal from its start.
  using Tree = std::map<std::string, std::string>;
  Tree listed();
  // Applies what the journal tells from `rank` on; moves `rank` on. False when expired.
  bool replay(Tree& tree, std::uint64_t& rank, std::uint64_t limit = 7);

  std::string root;
  StoreOptions options;
  SilentLog log;
  RecordingListener listener;
  std::unique_ptr<FolderStore> store;

 private:
  std::string _base;
};

}  // namespace skein::vald
