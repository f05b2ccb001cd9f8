// A cloud over a drive in a folder that goes with it, and time that the test turns.
#pragma once

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudCollector.h"
#include "linux/vald/cloud/Downloader.h"
#include "linux/vald/cloud/Eviction.h"
#include "linux/vald/cloud/Uploader.h"
#include "tests/vald_files/RecordingFileLayer.h"

namespace skein::vald {

// Set by one thread, waited for by another: never longer than a deadline.
class Event {
 public:
  void set();
  [[nodiscard]] bool wait();

 private:
  Mutex _mutex;
  CondVar _condition;
  bool _set SKEIN_GUARDED_BY(_mutex) = false;
};

// Stands still until the test advances it; what is due then runs on the test's thread. The
// date is the system's and what was advanced, since it is held against files' times.
class ManualClock final : public CloudClock {
 public:
  Duration now() override;
  NSDate date() override;
  void callAfter(Duration delay, Task task) override;

  void advance(Duration duration);
  // Waits until something waits for the time. False at the deadline.
  [[nodiscard]] bool waitForTimer();

 private:
  Mutex _mutex;
  CondVar _added;
  Duration _now SKEIN_GUARDED_BY(_mutex){};
  std::multimap<Duration, Task> _timers SKEIN_GUARDED_BY(_mutex);
};

// A folder that is removed with the object.
class TemporaryFolder {
 public:
  TemporaryFolder();
  ~TemporaryFolder();
  const std::filesystem::path& path() const { return _path; }

 private:
  std::filesystem::path _path;
};

// What one process has open of a cloud. `top`/drive is the store, `top`/cloud the cloud.
struct CloudRig {
  // `drives`: where the other drives of the user are, each with its "cloud"; empty: nowhere.
  explicit CloudRig(std::filesystem::path top, const std::filesystem::path& drives = {});

  CloudPlaces places();
  UploadServices uploads();

  // In the drive, with the given contents; its path.
  std::string write(const std::string& name, const std::string& contents);
  // Uploads the file as it is: nothing has to settle.
  UploadResult upload(VLFileObjectID document, const std::string& path);
  NSErrorPtr evict(VLFileObjectID document, const std::string& path);
  // On this thread, without a downloader.
  NSErrorPtr download(VLFileObjectID document, const std::string& path);
  Outcome<CloudCollector::Result> collect(std::chrono::nanoseconds time, std::uint64_t bytes);
  bool hasObject(const ContentHash& hash) const;
  // What is in the drive: the names, sorted.
  std::vector<std::string> names() const;

  const std::filesystem::path top;
  RecordingFileLayer files;
  StoreRoots roots;
  std::unique_ptr<CloudContents> contents;
  std::unique_ptr<CloudRecords> records;
  CloudConditions conditions;
  ManualClock clock;
  std::atomic<int> coordinated{0};
  std::vector<std::string> trashes;
};

std::string contentsOf(const std::string& path);
// Domain and code, or "none".
std::string brief(const NSErrorPtr& error);
// All that a document has besides its name: contents, mode, times, tags.
std::string portraitOf(const std::string& path);
void setTags(const std::string& path, const std::string& tags);

inline VLFileObjectID documentNumber(std::uint64_t number) {
  return VLFileObjectID::documentWithRawID(number);
}

}  // namespace skein::vald
