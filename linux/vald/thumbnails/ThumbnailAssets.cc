#include "linux/vald/thumbnails/ThumbnailAssets.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

constexpr std::size_t kHashDigits = 64;

std::string stemOf(const ContentHash& contents, PictureKind kind) {
  return contents.asString() + "-" + std::string(pictureKindName(kind));
}

std::string shardOf(const std::string& name) { return name.substr(0, 2); }
std::string placeOf(const std::string& name) { return shardOf(name) + "/" + name; }

FileDescriptor openFolder(int folder, const char* name) {
  return FileDescriptor(openat(folder, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

}  // namespace

Outcome<std::unique_ptr<ThumbnailAssets>> ThumbnailAssets::open(const std::string& folder,
                                                                FileLayer& files) {
  std::error_code failure;
  std::filesystem::create_directories(folder, failure);
  if (failure) return fileError(failure.value(), "can't make the thumbnails' folder", folder);
  const FileDescriptor top(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!top || fchmod(top.get(), 0700) != 0) {
    return fileError(errno, "can't open the thumbnails' folder", folder);
  }
  std::filesystem::remove_all(folder + "/incoming", failure);
  for (const char* name : {"pictures", "incoming"}) {
    const int code = files.makeFolder(top.get(), name, 0700);
    if (code != 0 && code != EEXIST) {
      return fileError(code, "can't make the thumbnails' folder", folder + "/" + name);
    }
  }
  FileDescriptor pictures = openFolder(top.get(), "pictures");
  FileDescriptor incoming = openFolder(top.get(), "incoming");
  if (!pictures || !incoming) {
    return fileError(errno, "can't open the thumbnails' folder", folder);
  }
  return std::unique_ptr<ThumbnailAssets>(
      new ThumbnailAssets(folder, files, std::move(pictures), std::move(incoming)));
}

std::string ThumbnailAssets::pathOf(const std::string& name) const {
  return _folder + "/pictures/" + placeOf(name);
}

bool ThumbnailAssets::stands(const std::string& name) const {
  struct stat status {};
  return fstatat(_pictures.get(), placeOf(name).c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISREG(status.st_mode);
}

std::optional<std::string> ThumbnailAssets::find(const ContentHash& contents,
                                                 PictureKind kind) const {
  for (const char* suffix : {".jpg", ".png"}) {
    const std::string name = stemOf(contents, kind) + suffix;
    if (stands(name)) return pathOf(name);
  }
  return std::nullopt;
}

Outcome<std::string> ThumbnailAssets::add(const ContentHash& contents, PictureKind kind,
                                          const RenderedPicture& picture) {
  const std::string name =
      stemOf(contents, kind) + (picture.format == PictureFormat::Jpeg ? ".jpg" : ".png");
  if (NSErrorPtr error = write(name, picture.bytes)) return error;
  return pathOf(name);
}

bool ThumbnailAssets::isHopeless(const ContentHash& contents, PictureKind kind) const {
  return stands(stemOf(contents, kind) + ".none");
}

NSErrorPtr ThumbnailAssets::setHopeless(const ContentHash& contents, PictureKind kind) {
  return write(stemOf(contents, kind) + ".none", {});
}

NSErrorPtr ThumbnailAssets::write(const std::string& name, std::string_view bytes) {
  const std::string incoming = std::to_string(_nextIncoming++);
  FileDescriptor file;
  int code = _files.createFile(_incoming.get(), incoming, 0600, file);
  if (code != 0) return fileError(code, "can't write the thumbnail", pathOf(name));
  code = _files.write(file.get(), bytes);
  // The rename itself may be lost with the power: the picture is then made again.
  if (code == 0) code = _files.sync(file.get());
  if (code == 0) {
    code = _files.makeFolder(_pictures.get(), shardOf(name), 0700);
    if (code == EEXIST) code = 0;
  }
  if (code == 0) {
    code = _files.renameOver(_incoming.get(), incoming, _pictures.get(), placeOf(name));
  }
  if (code == 0) return nullptr;
  // What cannot be removed now goes at the next opening.
  _files.unlink(_incoming.get(), incoming);
  return fileError(code, "can't write the thumbnail", pathOf(name));
}

Outcome<std::uint64_t> ThumbnailAssets::collectGarbage(
    const std::function<bool(const ContentHash&)>& isReferred) {
  std::uint64_t removed = 0;
  std::error_code failure;
  for (std::filesystem::recursive_directory_iterator entry(_folder + "/pictures", failure), end;
       !failure && entry != end; entry.increment(failure)) {
    const std::string name = entry->path().filename().string();
    const auto contents = ContentHash::parse(std::string_view(name).substr(0, kHashDigits));
    if (!contents || isReferred(*contents)) continue;
    // Set aside first: who takes it for a new record finds either the record here, or no
    // picture there.
    const std::string aside = std::to_string(_nextIncoming++);
    int code = _files.renameOver(_pictures.get(), placeOf(name), _incoming.get(), aside);
    const bool wanted = code == 0 && isReferred(*contents);
    if (wanted) code = _files.renameOver(_incoming.get(), aside, _pictures.get(), placeOf(name));
    if (code == 0 && !wanted) code = _files.unlink(_incoming.get(), aside);
    if (code != 0) return fileError(code, "can't remove the thumbnail", pathOf(name));
    if (!wanted) ++removed;
  }
  if (failure) return fileError(failure.value(), "can't read the thumbnails' folder", _folder);
  return removed;
}

}  // namespace skein::vald
