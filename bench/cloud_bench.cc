// What the local cloud costs: downloading 1 GiB without delay, beside `cp` and `sha256sum`
// of the same file in the same run, with and without waiting for the disk; how soon a
// download answers when it is cancelled; and evicting and downloading small documents one
// after the other, beside the plain calls that would do it.
//
// Bars: a download takes at most 1.5 times `cp` plus `sha256sum`; a cancelled one answers
// within 100 ms and leaves no part.
//
// cloud_bench [FOLDER]: works in a folder of its own there ("." unless given), and removes it.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <mutex>
#include <random>
#include <string>
#include <vector>

#include "base/ThreadPool.h"
#include "linux/vald/cloud/Downloader.h"
#include "linux/vald/cloud/Eviction.h"
#include "linux/vald/cloud/UploadAttempt.h"

namespace skein::vald {
namespace {

constexpr std::uint64_t kLarge = std::uint64_t{1} << 30;
constexpr int kRounds = 3;
constexpr int kCancels = 40;
constexpr int kSmall = 200;
constexpr double kMostTimesBaseline = 1.5;
constexpr double kLatestAnswer = 0.100;

double seconds(const std::function<void()>& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

void require(bool done, const std::string& what) {
  if (done) return;
  std::fprintf(stderr, "cloud_bench: %s\n", what.c_str());
  std::exit(2);
}
void require(const NSErrorPtr& error, const std::string& what) {
  require(error == nullptr, what + (error ? ": " + error->localizedDescription() : ""));
}
void shell(const std::string& command) {
  require(std::system(command.c_str()) == 0, "\"" + command + "\" failed");
}

class Bench {
 public:
  explicit Bench(std::filesystem::path folder) : _folder(std::move(folder)) {
    std::filesystem::create_directories(_folder / "drive");
    require(_roots.set({(_folder / "drive").string()}), "the drive");
    auto contents = CloudContents::open((_folder / "cloud").string(), _files);
    require(contents.error(), "the cloud");
    _contents = std::move(*contents);
    auto records = CloudRecords::open((_folder / "cloud/records").string());
    require(records.error(), "the records");
    _records = std::move(*records);
    _downloader = std::make_unique<Downloader>(places(), _conditions, _clock,
                                               std::make_shared<ThreadPool>(4, "download"));
  }
  ~Bench() {
    std::error_code ignored;
    std::filesystem::remove_all(_folder, ignored);
  }

  // Whether both bars are kept.
  bool run() {
    makeLargeFile();
    const bool quick = compareDownloads();
    const bool soon = cancelDownloads();
    compareSmallOnes();
    return quick && soon;
  }

 private:
  static constexpr std::uint64_t kLargeNumber = 1;

  std::string drivePath(const std::string& name) const {
    return (_folder / "drive" / name).string();
  }

  CloudPlaces places() {
    return {_roots, _files, *_contents, *_records, [](const std::string&) {
              return Outcome<std::shared_ptr<void>>(std::shared_ptr<void>());
            }};
  }

  void upload(std::uint64_t number, const std::string& path) {
    const UploadServices services{_roots, _files, *_contents, *_records, _conditions, _clock};
    Cancellation cancellation;
    const auto result = attemptUpload(services, VLFileObjectID::documentWithRawID(number), path,
                                      CloudClock::Duration(0), cancellation);
    require(std::holds_alternative<UploadDone>(result), "uploading " + path);
  }
  void evict(std::uint64_t number, const std::string& path) {
    require(Eviction(places()).evict({VLFileObjectID::documentWithRawID(number), path, {}}),
            "evicting");
  }

  void makeLargeFile() {
    const std::string path = drivePath("large");
    std::ofstream file(path, std::ios::binary);
    std::mt19937_64 random(1);
    std::vector<std::uint64_t> block(1 << 17);
    for (std::uint64_t written = 0; written < kLarge; written += block.size() * 8) {
      for (auto& word : block) word = random();
      file.write(reinterpret_cast<const char*>(block.data()),
                 static_cast<std::streamsize>(block.size() * 8));
    }
    file.close();
    require(static_cast<bool>(file), "writing 1 GiB");
    const double took = seconds([&] { upload(kLargeNumber, path); });
    std::printf("upload of 1 GiB, durable: %.2f s\n", took);
    evict(kLargeNumber, path);
    shell("sync");
  }

  // Answers how long it took until the completion.
  double download(std::uint64_t number, const std::string& path) {
    std::mutex mutex;
    std::condition_variable came;
    bool answered = false;
    return seconds([&] {
      _downloader->download(
          {VLFileObjectID::documentWithRawID(number), path, nullptr, [&](NSErrorPtr error) {
             require(error, "downloading");
             std::lock_guard lock(mutex);
             answered = true;
             came.notify_one();
           }});
      std::unique_lock lock(mutex);
      came.wait(lock, [&] { return answered; });
    });
  }

  bool compareDownloads() {
    const std::string path = drivePath("large");
    const std::string original = largestObject();
    const std::string copy = (_folder / "copy").string();
    std::vector<double> copies;
    std::vector<double> durable;
    std::vector<double> hashes;
    std::vector<double> downloads;
    for (int round = 0; round < kRounds; ++round) {
      copies.push_back(seconds([&] { shell("cp '" + original + "' '" + copy + "'"); }));
      hashes.push_back(seconds([&] { shell("sha256sum '" + copy + "' >/dev/null"); }));
      std::filesystem::remove(copy);
      durable.push_back(
          seconds([&] { shell("cp '" + original + "' '" + copy + "' && sync '" + copy + "'"); }));
      std::filesystem::remove(copy);
      downloads.push_back(download(kLargeNumber, path));
      evict(kLargeNumber, path);
    }
    const auto best = [](const std::vector<double>& all) {
      return *std::min_element(all.begin(), all.end());
    };
    const double baseline = best(copies) + best(hashes);
    const double ratio = best(downloads) / baseline;
    std::printf("download of 1 GiB, durable: %.2f s (best of %d)\n", best(downloads), kRounds);
    std::printf("  cp %.2f s + sha256sum %.2f s = %.2f s: %.2f times (bar %.1f)\n", best(copies),
                best(hashes), baseline, ratio, kMostTimesBaseline);
    std::printf("  cp and sync %.2f s + sha256sum: %.2f times\n", best(durable),
                best(downloads) / (best(durable) + best(hashes)));
    return ratio <= kMostTimesBaseline;
  }

  // Cancels at moments spread over a whole download.
  bool cancelDownloads() {
    const std::string path = drivePath("large");
    const double whole = download(kLargeNumber, path);
    evict(kLargeNumber, path);
    std::vector<double> answers;
    int came = 0;
    for (int round = 0; round < kCancels; ++round) {
      std::mutex mutex;
      std::condition_variable changed;
      std::optional<std::int64_t> code;
      const auto ticket = _downloader->download(
          {VLFileObjectID::documentWithRawID(kLargeNumber), path, nullptr, [&](NSErrorPtr error) {
             std::lock_guard lock(mutex);
             code = error == nullptr ? 0 : error->code();
             changed.notify_one();
           }});
      {
        std::unique_lock lock(mutex);
        changed.wait_for(lock, std::chrono::duration<double>(whole * round / kCancels));
      }
      bool part = false;
      answers.push_back(seconds([&] {
        ticket->cancel();
        std::unique_lock lock(mutex);
        changed.wait(lock, [&] { return code.has_value(); });
        part = std::filesystem::exists(drivePath(".large.skein-part"));
      }));
      require(!part, "a part is left");
      if (*code == 0) {
        ++came;
        evict(kLargeNumber, path);
      } else {
        require(*code == NSUserCancelledError, "a cancelled download failed otherwise");
      }
    }
    std::sort(answers.begin(), answers.end());
    std::printf(
        "cancel at %d moments: %.2f ms in the middle, %.2f ms at worst (bar %.0f ms); "
        "%d had come already\n",
        kCancels, answers[answers.size() / 2] * 1e3, answers.back() * 1e3, kLatestAnswer * 1e3,
        came);
    return answers.back() <= kLatestAnswer;
  }

  void compareSmallOnes() {
    std::vector<std::string> paths;
    for (int number = 0; number < kSmall; ++number) {
      paths.push_back(drivePath("small" + std::to_string(number)));
      std::ofstream(paths.back()) << std::string(4096, 'x') << number;
      upload(100 + number, paths.back());
    }
    const std::string text(4096, 'x');
    const double plain = seconds([&] {
      const int folder = open(drivePath("").c_str(), O_RDONLY | O_DIRECTORY);
      for (int number = 0; number < kSmall; ++number) {
        const std::string name = "plain" + std::to_string(number);
        const int file = openat(folder, name.c_str(), O_CREAT | O_WRONLY, 0600);
        require(write(file, text.data(), text.size()) == ssize_t{4096}, "writing");
        fsync(file);
        close(file);
        renameat(folder, name.c_str(), folder, (name + "-named").c_str());
        fsync(folder);
      }
      close(folder);
    });
    const double out = seconds([&] {
      for (int number = 0; number < kSmall; ++number) evict(100 + number, paths[number]);
    });
    const double back = seconds([&] {
      for (int number = 0; number < kSmall; ++number) download(100 + number, paths[number]);
    });
    std::printf(
        "each of %d documents of 4 KiB: evict %.2f ms, download %.2f ms; a durable write "
        "and rename by plain calls %.2f ms\n",
        kSmall, out / kSmall * 1e3, back / kSmall * 1e3, plain / kSmall * 1e3);
  }

  std::string largestObject() const {
    std::filesystem::path largest;
    for (const auto& entry :
         std::filesystem::recursive_directory_iterator(_folder / "cloud/objects")) {
      if (entry.is_regular_file() && entry.file_size() == kLarge) largest = entry.path();
    }
    require(!largest.empty(), "1 GiB is not in the cloud");
    return largest.string();
  }

  const std::filesystem::path _folder;
  FileLayer _files;
  StoreRoots _roots;
  std::unique_ptr<CloudContents> _contents;
  std::unique_ptr<CloudRecords> _records;
  CloudConditions _conditions;
  SystemCloudClock _clock;
  std::unique_ptr<Downloader> _downloader;
};

}  // namespace
}  // namespace skein::vald

int main(int argc, char** argv) {
  std::string folder = std::string(argc > 1 ? argv[1] : ".") + "/cloud-bench-XXXXXX";
  skein::vald::require(mkdtemp(folder.data()) != nullptr, "cannot make " + folder);
  return skein::vald::Bench(std::filesystem::absolute(folder)).run() ? 0 : 1;
}
