#include "linux/vald/files/Staging.h"

#include <sys/random.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {
namespace {

constexpr char kFolder[] = "staging";

int freshName(const char* prefix, std::string& name) {
  std::uint64_t number = 0;
  if (::getrandom(&number, sizeof(number), 0) != sizeof(number)) return EIO;
  char text[17];
  std::snprintf(text, sizeof(text), "%016llx", static_cast<unsigned long long>(number));
  name = std::string(prefix) + text;
  return 0;
}

}  // namespace

NSErrorPtr Staging::open(const std::string& stateDirectory, FileLayer& files) {
  DirectoryHandle state;
  int failure = DirectoryHandle::openRoot(stateDirectory, state);
  if (failure == 0) failure = files.makeFolder(state.get(), kFolder, 0700);
  if (failure == 0 || failure == EEXIST) failure = state.openFolder(kFolder, _folder);
  _path = joinPath(stateDirectory, kFolder);
  return failure == 0 ? nullptr : fileError(failure, "can't open the folder", _path);
}

NSErrorPtr Staging::place(const char* prefix, const StorePlace& beside, StagingPlace& place) {
  StagingPlace found;
  int failure = freshName(prefix, found.name);
  if (failure == 0) {
    const std::uint64_t mount = beside.folder.mountOf();
    found.outside = mount != 0 && mount == _folder.mountOf();
    if (found.outside) {
      MutexLock lock(_mutex);
      found.outside = !_refused.contains(beside.root->path);
    }
    const DirectoryHandle& folder = found.outside ? _folder : beside.folder;
    failure = folder.openFolder({}, found.folder);
  }
  if (failure != 0) return fileError(failure, "can't make room beside", beside.path());
  found.path = joinPath(found.outside ? _path : beside.folderPath(), found.name);
  place = std::move(found);
  return nullptr;
}

std::string Staging::sourceName(const std::string& copyPath) {
  return kRemovalPrefix + nameOfPath(copyPath).substr(sizeof kImportPrefix - 1);
}

void Staging::refuseOutside(const StorePlace& beside) {
  MutexLock lock(_mutex);
  _refused.insert(beside.root->path);
}

NSErrorPtr Staging::find(const std::string& path, const StoreRoots& roots,
                         StagingPlace& place) const {
  StagingPlace found;
  found.path = path;
  found.name = nameOfPath(path);
  // Only names of ours are ever looked for, since what is found is deleted.
  if (!isStagingName(found.name)) return fileError(EINVAL, "can't look for", path);
  found.outside = parentOfPath(path) == _path;
  if (found.outside) {
    if (const int failure = _folder.openFolder({}, found.folder)) {
      return fileError(failure, "can't open the folder", _path);
    }
  } else {
    StorePlace inStore;
    if (NSErrorPtr error = roots.locate(path, inStore)) return error;
    found.folder = std::move(inStore.folder);
  }
  place = std::move(found);
  return nullptr;
}

int Staging::clear(FileLayer& files, const std::set<std::string>& kept) const {
  int first = 0;
  const int failure = _folder.list([&](const std::string& name) {
    const int own = kept.contains(name) ? 0 : removeTree(files, _folder, name);
    if (first == 0) first = own;
    return true;
  });
  return first != 0 ? first : failure;
}

}  // namespace skein::vald
