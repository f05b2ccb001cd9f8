#include "linux/vald/files/TreeRemoval.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/TreeWalk.h"

namespace skein::vald {

namespace {

class Obstacle final : public TreeWalk {
 public:
  explicit Obstacle(const std::function<bool()>& goesOn) : _goesOn(goesOn) {}

 private:
  int visit(const DirectoryHandle& folder, const std::string& name,
            const struct stat& status) override {
    if (!S_ISDIR(status.st_mode)) return 0;
    if (!_goesOn()) return ECANCELED;
    return folder.mountOf(name) != folder.mountOf() ? EBUSY : 0;
  }
  int leave(const DirectoryHandle& folder, bool isEmpty) override {
    if (isEmpty || ::faccessat(folder.get(), ".", W_OK | X_OK, AT_EACCESS) == 0) return 0;
    return errno;
  }

  const std::function<bool()>& _goesOn;
};

// Goes on past what cannot be deleted.
class Remover final : public TreeWalk {
 public:
  explicit Remover(FileLayer& files) : _files(files) {}

  int first() const { return _first; }
  bool hasRemoved() const { return _hasRemoved; }

 private:
  int visit(const DirectoryHandle& folder, const std::string& name,
            const struct stat& status) override {
    if (!S_ISDIR(status.st_mode)) return note(_files.unlink(folder.get(), name));
    if (folder.mountOf(name) == folder.mountOf()) return 0;
    note(EBUSY);
    return kStepOver;
  }
  int didLeave(const DirectoryHandle& parent, const std::string& name) override {
    return note(_files.removeFolder(parent.get(), name));
  }
  int unreadable(int failure) override { return note(failure); }

  int note(int failure) {
    if (failure == 0) _hasRemoved = true;
    if (failure != 0 && failure != ENOENT && _first == 0) _first = failure;
    return 0;
  }

  FileLayer& _files;
  int _first = 0;
  bool _hasRemoved = false;
};

}  // namespace

NSErrorPtr obstacleToRemoval(const DirectoryHandle& folder, const std::string& name,
                             const std::string& path, const std::function<bool()>& goesOn) {
  Obstacle obstacle(goesOn);
  const int failure = obstacle.walk(folder, name, path);
  return failure == 0 ? nullptr : fileError(failure, "can't remove", obstacle.path());
}

int removeTree(FileLayer& files, const DirectoryHandle& folder, const std::string& name) {
  for (;;) {
    Remover remover(files);
    const int failure = remover.walk(folder, name, {});
    if (failure == ENOENT) return 0;
    const int first = remover.first() != 0 ? remover.first() : failure;
    // Some file systems lose their place in a folder from which entries go.
    if (first != ENOTEMPTY || !remover.hasRemoved()) return first;
  }
}

}  // namespace skein::vald
