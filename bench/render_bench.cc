// Thumbnails of 200 photographs of 12 megapixels, from uploaded contents to records that
// refer to asset files, beside a plain run of the same library: as many threads as there are
// cores, each of which loads a file scaled and saves it. At most 1.3 times as long.
//
//   render_bench [FOLDER]     a folder for about 1 GB; removed at the end
#include <gdk-pixbuf/gdk-pixbuf.h>
#include <sys/resource.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "base/ThreadPool.h"
#include "linux/protocol/ProcessLauncher.h"
#include "linux/vald/cloud/UploadAttempt.h"
#include "linux/vald/thumbnails/ThumbnailMaker.h"

namespace skein::vald {
namespace {

constexpr int kPhotographs = 200;
constexpr int kDifferent = 4;  // the others differ from these in a comment
constexpr int kWidth = 4000;
constexpr int kHeight = 3000;
constexpr int kRounds = 3;
constexpr double kMostTimesBaseline = 1.3;
constexpr int kNiceness = 10;  // as the workers have it

void require(bool condition, const std::string& what) {
  if (condition) return;
  std::fprintf(stderr, "render_bench: %s failed\n", what.c_str());
  std::exit(2);
}

template <class F>
double seconds(F&& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// Of the processor, by this process and those that it has ended.
double processorSeconds() {
  double sum = 0;
  for (const auto who : {RUSAGE_SELF, RUSAGE_CHILDREN}) {
    rusage used{};
    getrusage(who, &used);
    for (const timeval& time : {used.ru_utime, used.ru_stime}) {
      sum += static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
    }
  }
  return sum;
}

std::string photograph(unsigned seed) {
  GdkPixbuf* pixels = gdk_pixbuf_new(GDK_COLORSPACE_RGB, FALSE, 8, kWidth, kHeight);
  unsigned noise = seed;
  for (int y = 0; y < kHeight; ++y) {
    guchar* row = gdk_pixbuf_get_pixels(pixels) +
                  static_cast<std::ptrdiff_t>(y) * gdk_pixbuf_get_rowstride(pixels);
    for (int x = 0; x < kWidth; ++x, row += 3) {
      noise = noise * 1664525 + 1013904223;
      row[0] = static_cast<guchar>(x * 200 / kWidth + (noise >> 27));
      row[1] = static_cast<guchar>(y * 200 / kHeight + (noise >> 22 & 31));
      row[2] = static_cast<guchar>((x / 97 + y / 53 + static_cast<int>(seed)) % 200);
    }
  }
  gchar* bytes = nullptr;
  gsize length = 0;
  require(gdk_pixbuf_save_to_buffer(pixels, &bytes, &length, "jpeg", nullptr, "quality", "90",
                                    nullptr) != FALSE,
          "encoding");
  std::string result(bytes, length);
  g_free(bytes);
  g_object_unref(pixels);
  return result;
}

class QuietLog final : public Log {
 public:
  void write(LogType, std::string_view line) override {
    std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
  }
};

class Bench {
 public:
  explicit Bench(std::filesystem::path folder) : _folder(std::move(folder)) {
    std::filesystem::create_directories(_folder / "drive");
    require(_roots.set({(_folder / "drive").string()}) == nullptr, "the drive");
    auto contents = CloudContents::open((_folder / "cloud").string(), _files);
    require(static_cast<bool>(contents), "the cloud");
    _contents = std::move(*contents);
    auto records = CloudRecords::open((_folder / "cloud/records").string());
    require(static_cast<bool>(records), "the records");
    _records = std::move(*records);
  }
  ~Bench() {
    std::error_code ignored;
    std::filesystem::remove_all(_folder, ignored);
  }

  bool run() {
    makePhotographs();
    double plain = 1e9;
    double ours = 1e9;
    double plainProcessor = 1e9;
    double oursProcessor = 1e9;
    for (int round = 0; round < kRounds; ++round) {
      const double start = processorSeconds();
      plain = std::min(plain, seconds([&] { runPlain(); }));
      const double between = processorSeconds();
      ours = std::min(ours, runOurs());
      plainProcessor = std::min(plainProcessor, between - start);
      oursProcessor = std::min(oursProcessor, processorSeconds() - between);
    }
    const double ratio = ours / plain;
    std::printf("%d photographs of %d x %d, %zu at a time (best of %d)\n", kPhotographs, kWidth,
                kHeight, _cores, kRounds);
    std::printf("  plain: load scaled and save    %6.2f s  %5.1f ms each\n", plain,
                plain / kPhotographs * 1e3);
    std::printf("  from the cloud to the records  %6.2f s  %5.1f ms each: %.2f times (bar %.1f)\n",
                ours, ours / kPhotographs * 1e3, ratio, kMostTimesBaseline);
    std::printf("  of the processor's time %.2f s and %.2f s: %.2f times\n", plainProcessor,
                oursProcessor, oursProcessor / plainProcessor);
    rusage worker{};
    getrusage(RUSAGE_CHILDREN, &worker);
    std::printf("  peak of one worker %ld MiB; its limit is 1024 MiB of address space\n",
                worker.ru_maxrss >> 10);
    return ratio <= kMostTimesBaseline;
  }

 private:
  static VLFileObjectID document(int number) {
    return VLFileObjectID::documentWithRawID(static_cast<std::uint64_t>(number + 1));
  }
  std::string path(int number) const {
    return (_folder / "drive" / (std::to_string(number) + ".jpg")).string();
  }

  void makePhotographs() {
    std::vector<std::string> different;
    for (unsigned seed = 1; seed <= kDifferent; ++seed) different.push_back(photograph(seed));
    const UploadServices services{_roots, _files, *_contents, *_records, _conditions, _clock};
    Cancellation cancellation;
    std::uintmax_t bytes = 0;
    for (int number = 0; number < kPhotographs; ++number) {
      const std::string& picture = different[static_cast<std::size_t>(number % kDifferent)];
      char comment[16];
      std::snprintf(comment, sizeof comment, "%08d", number);
      std::ofstream file(path(number), std::ios::binary);
      file << picture.substr(0, 2) << std::string("\xff\xfe\x00\x0a", 4) << comment
           << picture.substr(2);
      file.close();
      require(static_cast<bool>(file), "writing " + path(number));
      bytes += picture.size();
      require(std::holds_alternative<UploadDone>(attemptUpload(
                  services, document(number), path(number), CloudClock::Duration(0), cancellation)),
              "uploading");
    }
    std::printf("%.1f MB each\n", static_cast<double>(bytes) / kPhotographs / 1e6);
  }

  void runPlain() {
    std::filesystem::create_directories(_folder / "plain");
    std::atomic<int> next{0};
    std::vector<std::thread> threads;
    for (std::size_t core = 0; core < _cores; ++core) {
      threads.emplace_back([&] {
        for (int number = next++; number < kPhotographs; number = next++) {
          GdkPixbuf* pixels =
              gdk_pixbuf_new_from_file_at_scale(path(number).c_str(), 1024, 1024, TRUE, nullptr);
          const std::string to = (_folder / "plain" / std::to_string(number)).string();
          require(pixels != nullptr && gdk_pixbuf_save(pixels, to.c_str(), "jpeg", nullptr,
                                                       "quality", "85", nullptr) != FALSE,
                  "a plain thumbnail");
          g_object_unref(pixels);
        }
      });
    }
    for (std::thread& thread : threads) thread.join();
  }

  // With the start of the workers, until the last record refers to its asset file.
  double runOurs() {
    std::filesystem::remove_all(_folder / "thumbnails");
    for (int number = 0; number < kPhotographs; ++number) {
      const auto record = _records->record(document(number));
      require(record && *record &&
                  _records->setThumbnail(document(number), (*record)->contents.hash,
                                         std::nullopt) == nullptr,
              "forgetting a thumbnail");
    }
    auto assets = ThumbnailAssets::open((_folder / "thumbnails").string(), _files);
    require(static_cast<bool>(assets), "the thumbnails' folder");
    const auto pool = std::make_shared<ThreadPool>(_cores + 2, "thumbnails");
    ThumbnailRenderer::Options options;
    options.limit = _cores;
    options.worker.program = folderOfThisProgram() + "/../bin/skein-thumbnailer";
    ThumbnailRenderer renderer(options, pool, _clock, _log);
    ThumbnailMaker maker({*_contents, *_records, **assets, renderer, _log,
                          [](VLFileObjectID) { return "image/jpeg"; }},
                         pool, 2 * _cores);
    const double took = seconds([&] {
      for (int number = 0; number < kPhotographs; ++number) {
        maker.documentWasUploaded(document(number));
      }
      require(maker.waitUntilIdle(std::chrono::steady_clock::now() + std::chrono::minutes(10)),
              "making thumbnails in time");
    });
    for (int number = 0; number < kPhotographs; ++number) {
      const auto record = _records->record(document(number));
      require(record && *record && (*record)->thumbnail &&
                  std::filesystem::file_size(*(*record)->thumbnail) > 1000,
              "a thumbnail");
    }
    return took;
  }

  const std::filesystem::path _folder;
  const std::size_t _cores = std::max(1U, std::thread::hardware_concurrency());
  FileLayer _files;
  StoreRoots _roots;
  std::unique_ptr<CloudContents> _contents;
  std::unique_ptr<CloudRecords> _records;
  CloudConditions _conditions;
  SystemCloudClock _clock;
  QuietLog _log;
};

}  // namespace
}  // namespace skein::vald

int main(int argc, char** argv) {
  setpriority(PRIO_PROCESS, 0, skein::vald::kNiceness);
  std::string folder = std::string(argc > 1 ? argv[1] : ".") + "/render-bench-XXXXXX";
  skein::vald::require(mkdtemp(folder.data()) != nullptr, "making " + folder);
  return skein::vald::Bench(std::filesystem::absolute(folder)).run() ? 0 : 1;
}
