// A drive's folder, its state and a place outside, made fresh under the temporary folder.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "tests/vald_files/RecordingFileLayer.h"

namespace skein::vald {

class QuietLog : public Log {
 public:
  void write(LogType, std::string_view line) override { lines.emplace_back(line); }
  std::vector<std::string> lines;
};

class TestDrive {
 public:
  // `stateBase`: where the state lies; another volume makes staging happen in the store.
  explicit TestDrive(const std::string& stateBase = {}) {
    top = fresh(base());
    store = top + "/store";
    outside = top + "/outside";
    state = stateBase.empty() ? top + "/state" : fresh(stateBase);
    container = otherVolume().empty() ? top + "/container" : fresh(otherVolume());
    for (const std::string& folder : {store, outside, state, container}) {
      std::filesystem::create_directories(folder);
    }
  }
  TestDrive(const TestDrive&) = delete;
  TestDrive& operator=(const TestDrive&) = delete;
  ~TestDrive() {
    operations.reset();
    std::filesystem::remove_all(top);
    std::filesystem::remove_all(state);
    std::filesystem::remove_all(container);
  }

  // Where user attributes are more likely to be than in a temporary folder in memory.
  static std::string base() {
    return ::getenv("TEST_TMPDIR") != nullptr ? ::testing::TempDir() : "/var/tmp";
  }

  // A folder on another volume than base(); empty when there is none.
  static std::string otherVolume() {
    struct stat shared {};
    struct stat own {};
    if (::stat("/dev/shm", &shared) != 0 || ::access("/dev/shm", W_OK) != 0) return {};
    return ::stat(base().c_str(), &own) == 0 && shared.st_dev != own.st_dev ? "/dev/shm" : "";
  }

  // lockDeadline: what an operation waits for others and for locks; tests of refusals wait little.
  FileOperations& open(std::chrono::milliseconds lockDeadline = std::chrono::milliseconds(50)) {
    operations.reset();
    FileOperationsOptions options;
    options.roots = {store, container};
    options.stateDirectory = state;
    options.lockDeadline = lockDeadline;
    NSErrorPtr error;
    operations = FileOperations::open(options, files, log, &error);
    EXPECT_TRUE(operations) << (error ? error->localizedDescription() : "");
    return *operations;
  }

  std::string at(const std::string& relative) const { return store + '/' + relative; }
  void write(const std::string& relative, const std::string& bytes) const {
    put(at(relative), bytes);
  }
  void makeFolder(const std::string& relative) const {
    std::filesystem::create_directories(at(relative));
  }
  bool exists(const std::string& relative) const {
    return std::filesystem::exists(std::filesystem::symlink_status(at(relative)));
  }
  void tag(const std::string& relative, const std::vector<std::string>& names) {
    ASSERT_EQ(operations->setTags(at(relative), names).storage, TagStorage::Kept);
  }

  static void put(const std::string& path, const std::string& bytes) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << bytes;
  }
  static std::string get(const std::string& path) {
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();
    return bytes.str();
  }

  // All that a person could tell of the store: each path's kind, mode, contents and tags,
  // and files' times. Without dates of deletion,
  // and, unless asked for, what the next start clears away.
  std::map<std::string, std::string> snapshot(bool withStaging = false) {
    std::map<std::string, std::string> all;
    DirectoryHandle root;
    EXPECT_EQ(DirectoryHandle::openRoot(store, root), 0);
    look(root, {}, withStaging, all);
    EXPECT_EQ(DirectoryHandle::openRoot(container, root), 0);
    look(root, container, withStaging, all);
    return all;
  }

  std::string top, store, outside, state;
  std::string container;  // another root, on the other volume where there is one
  RecordingFileLayer files;
  QuietLog log;
  std::unique_ptr<FileOperations> operations;

 private:
  static std::string fresh(const std::string& base) {
    std::string name = base + "/skein-files-XXXXXX";
    EXPECT_NE(::mkdtemp(name.data()), nullptr);
    return std::filesystem::canonical(name).native();
  }

  std::string absolute(const std::string& relative) const {
    return relative.starts_with('/') ? relative : at(relative);
  }

  // It tells of an item that is gone, so nobody sees it.
  bool isOrphanInfo(const std::string& relative) const {
    if (!relative.ends_with(".trashinfo")) return false;
    const std::string name = nameOfPath(relative).substr(0, nameOfPath(relative).size() - 10);
    const std::string item = joinPath(parentOfPath(parentOfPath(relative)), "files/" + name);
    return !std::filesystem::exists(std::filesystem::symlink_status(absolute(item)));
  }

  void look(const DirectoryHandle& folder, const std::string& below, bool withStaging,
            std::map<std::string, std::string>& all) {
    folder.list([&](const std::string& name) {
      const std::string relative = joinPath(below, name);
      if (!withStaging && (isStagingName(name) || isOrphanInfo(relative))) return true;

      struct stat status {};
      EXPECT_EQ(folder.status(name, status), 0);
      std::ostringstream text;
      text << std::oct << status.st_mode << ' ' << joinTags(readTags(folder, name, name).names);
      if (S_ISREG(status.st_mode)) {
        std::string bytes = get(absolute(relative));
        if (relative.ends_with(".trashinfo")) {
          bytes.resize(std::min(bytes.find("DeletionDate="), bytes.size()));
        } else {
          text << ' ' << status.st_mtim.tv_sec << '.' << status.st_mtim.tv_nsec;
        }
        text << ' ' << bytes;
      }
      std::string target;
      if (S_ISLNK(status.st_mode) && folder.readLink(name, target) == 0) text << ' ' << target;
      all[relative.starts_with('/') ? "container" + relative.substr(container.size()) : relative] =
          text.str();
      if (!S_ISDIR(status.st_mode)) return true;
      DirectoryHandle inner;
      EXPECT_EQ(folder.openFolder(name, inner), 0);
      look(inner, relative, withStaging, all);
      return true;
    });
  }
};

inline std::int64_t codeOf(const NSErrorPtr& error) { return error ? error->code() : 0; }
inline std::int64_t posixOf(const NSErrorPtr& error) {
  return error && error->underlyingError() ? error->underlyingError()->code() : 0;
}
inline std::string wordsOf(const NSErrorPtr& error) {
  return error ? error->localizedDescription() : "";
}
inline std::string urlOf(const NSErrorPtr& error) {
  const auto found = error->userInfo().find(NSURLErrorKey);
  if (found == error->userInfo().end()) return {};
  const auto* url = std::get_if<NSURLPtr>(&found->second);
  return url != nullptr && *url ? (*url)->path() : "";
}

}  // namespace skein::vald
