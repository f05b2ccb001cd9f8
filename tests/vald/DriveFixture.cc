#include "tests/vald/DriveFixture.h"

#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "platform/fileprovider/FPTags.h"

namespace skein::vald {

using namespace std::chrono_literals;

std::uint64_t DriveFixture::Listener::told() {
  MutexLock lock(_mutex);
  return _told;
}

void DriveFixture::Listener::wait(std::uint64_t told) {
  const auto until = std::chrono::steady_clock::now() + 200ms;
  MutexLock lock(_mutex);
  while (_told == told && _changed.waitUntil(_mutex, until)) {
  }
}

void DriveFixture::Listener::tell() {
  {
    MutexLock lock(_mutex);
    ++_told;
  }
  _changed.notifyAll();
}

void DriveFixture::SetUp() {
  // Not in memory: tags are attributes.
  const char* folder = std::getenv("TEST_TMPDIR");
  std::string pattern =
      std::string(folder != nullptr ? folder : "/var/tmp") + "/skein-drive-XXXXXX";
  ASSERT_NE(mkdtemp(pattern.data()), nullptr);
  base = std::filesystem::canonical(pattern).native();
  root = base + "/drive";
  for (const char* name : {"drive", "state", "cloud"}) {
    std::filesystem::create_directory(base + '/' + name);
  }
  options.store.databasePath = base + "/state/index.sqlite";
  options.store.drive.path = root;
  options.stateDirectory = base + "/state";
  options.cloud.folder = base + "/cloud";
  options.cloud.policy = {LocalCloudStatus::Uploads::Unlimited, 0};
  options.cloud.allowsConditions = true;
  options.cloud.uploads.settle = 1ms;
}

void DriveFixture::TearDown() {
  close();
  std::filesystem::remove_all(base);
}

void DriveFixture::open() {
  NSErrorPtr error;
  drive = Drive::open(options, _listener, layer, log, &error);
  ASSERT_NE(drive, nullptr) << (error ? error->localizedDescription() : "");
  settle();
}

void DriveFixture::reopen() {
  close();
  open();
}

void DriveFixture::settle() { ASSERT_TRUE(drive->store().settle(60s)); }

NSURLPtr DriveFixture::url(const std::string& path) const {
  return NSURL::fileURLWithPath(path.empty() ? root : at(path));
}

void DriveFixture::write(const std::string& path, const std::string& text) {
  std::filesystem::create_directories(std::filesystem::path(at(path)).parent_path());
  std::ofstream(at(path), std::ios::binary) << text;
}

std::string DriveFixture::read(const std::string& path) const {
  std::ostringstream text;
  text << std::ifstream(at(path), std::ios::binary).rdbuf();
  return text.str();
}

bool DriveFixture::exists(const std::string& path) const {
  return std::filesystem::exists(std::filesystem::symlink_status(at(path)));
}

void DriveFixture::rename(const std::string& from, const std::string& to) {
  ASSERT_EQ(::rename(at(from).c_str(), at(to).c_str()), 0) << from;
}

VLQueryItemPtr DriveFixture::item(const std::string& path) {
  return drive->store().itemAtPath(path.empty() ? root : at(path), false, nullptr);
}

std::string DriveFixture::id(const std::string& path) {
  const VLQueryItemPtr found = item(path);
  return found ? found->fileObjectID().asString() : "";
}

std::vector<std::string> DriveFixture::tags(const std::string& path) {
  std::vector<std::string> names;
  const VLQueryItemPtr found = item(path);
  for (FPTag& tag : FPGetTagsFromTagsData(found ? found->tagData() : std::nullopt)) {
    names.push_back(std::move(tag.label));
  }
  return names;
}

std::string DriveFixture::portrait(const std::string& path) {
  const VLQueryItemPtr found = item(path);
  if (!found) return "none";
  std::ostringstream text;
  text << found->itemIdentifier() << ' ' << joinTags(tags(path)) << ' '
       << found->favoriteRank().value_or(-1) << ' '
       << found->lastUsedDate().value_or(NSDate()).time_since_epoch().count();
  return text.str();
}

std::vector<std::string> DriveFixture::listed(const std::string& folder) {
  std::vector<std::string> names;
  NSErrorPtr error;
  std::optional<VLFileObjectID> number;
  if (!folder.empty()) number = item(folder)->fileObjectID();
  const Page page = drive->store().listFolder(number, SortOrder::Name, 0, 1000, &error);
  EXPECT_EQ(error, nullptr);
  for (const VLQueryItemPtr& one : page.items) names.push_back(one->filename());
  return names;
}

std::string DriveFixture::renamed(const std::string& from, const std::string& name) {
  return path([&](LocalFiles& files, auto reply) {
    files.rename(url(from), name, "test", std::move(reply));
  });
}

std::string DriveFixture::moved(const std::string& from, const std::string& folder, bool bounce) {
  return path([&](LocalFiles& files, auto reply) {
    files.move(url(from), url(folder), std::nullopt, bounce, "test", std::move(reply));
  });
}

std::string DriveFixture::trashed(const std::string& what) {
  return path(
      [&](LocalFiles& files, auto reply) { files.trash(url(what), "test", std::move(reply)); });
}

std::string DriveFixture::removed(const std::string& what) {
  return outcome(
      [&](LocalFiles& files, auto reply) { files.remove(url(what), "test", std::move(reply)); });
}

std::string DriveFixture::tagged(const std::string& what, std::vector<std::string> names) {
  return outcome([&](LocalFiles& files, auto reply) {
    files.setTagNames(url(what), std::move(names), std::move(reply));
  });
}

std::string DriveFixture::ranked(const std::string& what, std::optional<std::int64_t> rank) {
  return outcome([&](LocalFiles& files, auto reply) {
    files.setFavoriteRank(url(what), rank, std::move(reply));
  });
}

std::string DriveFixture::used(const std::string& what, NSDate date) {
  return outcome([&](LocalFiles& files, auto reply) {
    files.setLastOpenDate(url(what), date, std::move(reply));
  });
}

std::string DriveFixture::evicted(const std::string& what) {
  return outcome([&](LocalFiles& files, auto reply) { files.evict(url(what), std::move(reply)); });
}

std::string DriveFixture::downloaded(const std::string& what) {
  return outcome(
      [&](LocalFiles& files, auto reply) { files.download(url(what), false, std::move(reply)); });
}

bool DriveFixture::eventually(const std::function<bool()>& holds) {
  const auto until = std::chrono::steady_clock::now() + 30s;
  while (std::chrono::steady_clock::now() < until) {
    const std::uint64_t told = _listener.told();
    if (holds()) return true;
    _listener.wait(told);
  }
  return false;
}

bool DriveFixture::uploaded(const std::string& what) {
  return eventually([&] {
    const VLQueryItemPtr found = item(what);
    if (!found) return false;
    const auto state = drive->cloud().uploader().state(found->fileObjectID());
    const bool isDone = state && *state && (*state)->phase == UploadState::Phase::Uploaded;
    return isDone && found->isUploaded() && drive->store().isSettled(found->fileObjectID());
  });
}

}  // namespace skein::vald
