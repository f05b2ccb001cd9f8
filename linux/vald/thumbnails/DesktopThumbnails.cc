#include "linux/vald/thumbnails/DesktopThumbnails.h"

#include <fcntl.h>
#include <glib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <optional>
#include <utility>

#include "base/Mutex.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/thumbnails/PngText.h"

namespace skein::vald {
namespace {

// The desktop's names for the sizes, smallest first, and the side of each.
struct Size {
  const char* name;
  std::uint32_t side;
};
constexpr std::array<Size, 4> kSizes{
    {{"normal", 128}, {"large", 256}, {"x-large", 512}, {"xx-large", 1024}}};

// Tells this system's entries from those of others.
constexpr char kSoftwareKey[] = "Software";
constexpr char kSoftware[] = "Skein Drive";
// The texts stand in front of the pixels.
constexpr std::size_t kHead = 4096;

std::string urlOf(const std::string& path) {
  char* url = g_filename_to_uri(path.c_str(), nullptr, nullptr);
  std::string result = url != nullptr ? url : "";
  g_free(url);
  return result;
}

std::string headOf(const std::string& path) {
  std::string head(kHead, '\0');
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  const ssize_t length = file ? read(file.get(), head.data(), head.size()) : 0;
  head.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
  return head;
}

// An entry appears whole or not at all. It is a cache: no power cut matters.
NSErrorPtr writeWhole(const std::string& path, const std::string& bytes) {
  std::string temporary = path + ".skein-XXXXXX";
  const FileDescriptor file(mkostemp(temporary.data(), O_CLOEXEC));
  if (!file) return fileError(errno, "can't write", path);
  std::size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t length = ::write(file.get(), bytes.data() + done, bytes.size() - done);
    if (length < 0 && errno == EINTR) continue;
    if (length <= 0) break;
    done += static_cast<std::size_t>(length);
  }
  if (done == bytes.size() && rename(temporary.c_str(), path.c_str()) == 0) return nullptr;
  const int code = errno;
  unlink(temporary.c_str());
  return fileError(code, "can't write", path);
}

NSErrorPtr makeFolder(const std::string& path) {
  std::error_code failure;
  std::filesystem::create_directories(std::filesystem::path(path).parent_path(), failure);
  if (!failure && mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
    return fileError(errno, "can't make the folder", path);
  }
  return failure ? fileError(failure.value(), "can't make the folder", path) : nullptr;
}

// An answer that one thread waits for.
struct Answer {
  Mutex mutex;
  CondVar came;
  std::optional<Outcome<RenderedPicture>> picture SKEIN_GUARDED_BY(mutex);
};

}  // namespace

struct DesktopThumbnails::Entry {
  std::string path;
  std::uint32_t side = 0;
  PngTexts texts;
};

DesktopThumbnails::DesktopThumbnails(std::string folder, ThumbnailRenderer& renderer,
                                     std::shared_ptr<Executor> executor, Log& log)
    : _folder(std::move(folder)),
      _renderer(renderer),
      _executor(std::move(executor)),
      _log(log),
      _runner(_executor, 1) {}

DesktopThumbnails::~DesktopThumbnails() = default;

std::string DesktopThumbnails::userFolder() {
  return std::string(g_get_user_cache_dir()) + "/thumbnails";
}

std::string DesktopThumbnails::entryPath(std::string_view size, const std::string& url) const {
  char* digest = g_compute_checksum_for_string(G_CHECKSUM_MD5, url.c_str(), -1);
  std::string path = _folder + "/" + std::string(size) + "/" + digest + ".png";
  g_free(digest);
  return path;
}

void DesktopThumbnails::documentWasEvicted(std::string path, CloudRecord record) {
  _runner.post([this, path = std::move(path), record = std::move(record)] {
    if (record.thumbnail) {
      write(path, record);
    } else {
      remove(path);
    }
  });
}

void DesktopThumbnails::documentCameBack(std::string path) {
  _runner.post([this, path = std::move(path)] { remove(path); });
}

void DesktopThumbnails::write(const std::string& path, const CloudRecord& record) {
  const std::string url = urlOf(path);
  const auto seconds =
      std::chrono::floor<std::chrono::seconds>(record.modified.time_since_epoch()).count();
  Entry entry;
  entry.texts = {{"Thumb::URI", url},
                 {"Thumb::MTime", std::to_string(seconds)},
                 {"Thumb::Size", std::to_string(record.contents.size)},
                 {kSoftwareKey, kSoftware}};
  for (const Size& size : kSizes) {
    entry.path = entryPath(size.name, url);
    entry.side = size.side;
    bool isLargest = false;
    NSErrorPtr error = makeFolder(_folder);
    if (error == nullptr) error = makeFolder(_folder + "/" + size.name);
    if (error == nullptr) error = writeEntry(entry, *record.thumbnail, isLargest);
    if (error != nullptr) {
      VL_ERROR(_log, "[ERROR] no entry in the desktop's thumbnails for %@: %@", path,
               error->localizedDescription());
      return;
    }
    if (isLargest) return;
  }
}

NSErrorPtr DesktopThumbnails::writeEntry(const Entry& entry, const std::string& picture,
                                         bool& isLargest) {
  const auto drawn = draw(picture, entry.side);
  if (!drawn) return drawn.error();
  // Pictures are not enlarged: one that does not fill this size has no larger one.
  isLargest = drawn->width < entry.side && drawn->height < entry.side;
  return writeWhole(entry.path, pngWithTexts(drawn->bytes, entry.texts));
}

Outcome<RenderedPicture> DesktopThumbnails::draw(const std::string& picture, std::uint32_t side) {
  FileDescriptor file(open(picture.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) return fileError(errno, "can't open the thumbnail", picture);
  const auto answer = std::make_shared<Answer>();
  ThumbnailRenderer::Request request;
  request.kind = picture.ends_with(".png") ? PictureKind::Png : PictureKind::Jpeg;
  request.format = PictureFormat::Png;
  request.side = side;
  request.document = std::move(file);
  request.completion = [answer](Outcome<RenderedPicture> drawn) {
    MutexLock lock(answer->mutex);
    answer->picture = std::move(drawn);
    answer->came.notifyAll();
  };
  _renderer.render(std::move(request));
  const ScopedWait wait(*_executor);
  MutexLock lock(answer->mutex);
  while (!answer->picture) answer->came.wait(answer->mutex);
  return std::move(*answer->picture);
}

void DesktopThumbnails::remove(const std::string& path) {
  const std::string url = urlOf(path);
  for (const Size& size : kSizes) {
    const std::string entry = entryPath(size.name, url);
    if (pngText(headOf(entry), kSoftwareKey) != kSoftware) continue;
    if (unlink(entry.c_str()) != 0 && errno != ENOENT) {
      VL_ERROR(_log, "[ERROR] %@ is out of date and can't be removed: errno %d", entry, errno);
    }
  }
}

}  // namespace skein::vald
