#include "tests/vald_cloud/CloudRig.h"

#include <sys/stat.h>
#include <sys/xattr.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <sstream>

#include "linux/vald/files/TagAttributes.h"

namespace skein::vald {
namespace {

std::chrono::steady_clock::time_point deadline() {
  return std::chrono::steady_clock::now() + std::chrono::seconds(30);
}

}  // namespace

void Event::set() {
  MutexLock lock(_mutex);
  _set = true;
  _condition.notifyAll();
}

bool Event::wait() {
  const auto end = deadline();
  MutexLock lock(_mutex);
  while (!_set) {
    if (!_condition.waitUntil(_mutex, end)) return _set;
  }
  return true;
}

CloudClock::Duration ManualClock::now() {
  MutexLock lock(_mutex);
  return _now;
}

NSDate ManualClock::date() { return std::chrono::system_clock::now() + now(); }

void ManualClock::callAfter(Duration delay, Task task) {
  MutexLock lock(_mutex);
  _timers.emplace(_now + delay, std::move(task));
  _added.notifyAll();
}

void ManualClock::advance(Duration duration) {
  const Duration end = now() + duration;
  for (;;) {
    Task task;
    {
      MutexLock lock(_mutex);
      if (_timers.empty() || _timers.begin()->first > end) {
        _now = end;
        return;
      }
      _now = std::max(_now, _timers.begin()->first);
      task = std::move(_timers.begin()->second);
      _timers.erase(_timers.begin());
    }
    task();
  }
}

bool ManualClock::waitForTimer() {
  const auto end = deadline();
  MutexLock lock(_mutex);
  while (_timers.empty()) {
    if (!_added.waitUntil(_mutex, end)) return !_timers.empty();
  }
  return true;
}

TemporaryFolder::TemporaryFolder() {
  std::string name = (std::filesystem::temp_directory_path() / "skein-cloud-XXXXXX").string();
  if (mkdtemp(name.data()) == nullptr) std::abort();
  _path = name;
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

CloudRig::CloudRig(std::filesystem::path where, const std::filesystem::path& drives)
    : top(std::move(where)) {
  std::filesystem::create_directories(top / "drive");
  EXPECT_EQ(brief(roots.set({(top / "drive").string()})), "none");
  auto openContents = CloudContents::open((top / "cloud").string(), files, drives.string());
  EXPECT_TRUE(openContents);
  contents = std::move(*openContents);
  auto openRecords = CloudRecords::open((top / "cloud/records").string());
  EXPECT_TRUE(openRecords);
  records = std::move(*openRecords);
  EXPECT_EQ(brief(CloudCollector(places(), clock).begin()), "none");
}

Outcome<CloudCollector::Result> CloudRig::collect(std::chrono::nanoseconds time,
                                                  std::uint64_t bytes) {
  Cancellation cancellation;
  return CloudCollector(places(), clock).collect(time, bytes, cancellation);
}

bool CloudRig::hasObject(const ContentHash& hash) const {
  return std::filesystem::exists(top / "cloud/objects" / hash.asString().substr(0, 2) /
                                 hash.asString());
}

CloudPlaces CloudRig::places() {
  return {roots,
          files,
          *contents,
          *records,
          [this](const std::string&) {
            ++coordinated;
            return Outcome<std::shared_ptr<void>>(std::shared_ptr<void>());
          },
          trashes};
}

UploadServices CloudRig::uploads() {
  return {roots, files, *contents, *records, conditions, clock};
}

std::string CloudRig::write(const std::string& name, const std::string& contents) {
  const std::string path = (top / "drive" / name).string();
  std::ofstream(path, std::ios::binary) << contents;
  return path;
}

UploadResult CloudRig::upload(VLFileObjectID document, const std::string& path) {
  Cancellation cancellation;
  return attemptUpload(uploads(), document, path, CloudClock::Duration(0), cancellation);
}

NSErrorPtr CloudRig::evict(VLFileObjectID document, const std::string& path) {
  return Eviction(places()).evict({document, path, "text/plain"});
}

NSErrorPtr CloudRig::download(VLFileObjectID document, const std::string& path) {
  return DownloadTransfer(places(), conditions, clock, document, path, false, nullptr).run();
}

std::vector<std::string> CloudRig::names() const {
  std::vector<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(top / "drive")) {
    names.push_back(entry.path().filename().string());
  }
  std::sort(names.begin(), names.end());
  return names;
}

std::string contentsOf(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

std::string brief(const NSErrorPtr& error) {
  return error == nullptr ? "none" : error->domain() + " " + std::to_string(error->code());
}

std::string portraitOf(const std::string& path) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return "none";
  char tags[256];
  const ssize_t size = getxattr(path.c_str(), kTagsAttribute, tags, sizeof tags);
  std::ostringstream text;
  text << std::oct << status.st_mode << std::dec << ' ' << status.st_mtim.tv_sec << '.'
       << status.st_mtim.tv_nsec << " [" << std::string(tags, size > 0 ? size : 0) << "] "
       << contentsOf(path);
  return text.str();
}

void setTags(const std::string& path, const std::string& tags) {
  EXPECT_EQ(setxattr(path.c_str(), kTagsAttribute, tags.data(), tags.size(), 0), 0);
}

}  // namespace skein::vald
