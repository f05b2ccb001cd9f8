#include "linux/host/StoreCheck.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <map>
#include <set>
#include <string>
#include <utility>

#include "linux/protocol/AnswerRoom.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/LeftOutNote.h"
#include "linux/protocol/ReservedNames.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLQueryItem.h"

namespace skein {
namespace {

using namespace std::chrono_literals;

constexpr std::uint64_t kMostDifferences = 10'000;
// How often, and after which pause, a folder that differs is looked at again: vald follows
// the disk within this.
constexpr int kMostLooks = 4;
constexpr auto kBetweenLooks = 500ms;
// How many markers vald is asked of at once, by their paths.
constexpr std::size_t kMostMarkers = 200;
constexpr std::size_t kMostMarkerBytes = std::size_t{64} << 10;

struct DiskEntry {
  bool isFolder = false;
  std::uint64_t size = 0;
};
using DiskEntries = std::map<std::string, DiskEntry>;

// What a folder holds that belongs into a drive: documents, folders, links.
int readFolder(const std::string& path, DiskEntries& entries) {
  FileDescriptor folder(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
  if (!folder) return errno;
  DIR* stream = fdopendir(folder.get());
  if (stream == nullptr) return errno;
  folder.release();
  while (const dirent* entry = readdir(stream)) {
    const std::string name = entry->d_name;
    if (name == "." || name == "..") continue;
    struct stat status {};
    if (fstatat(dirfd(stream), entry->d_name, &status, AT_SYMLINK_NOFOLLOW) != 0) continue;
    if (!S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode) && !S_ISLNK(status.st_mode)) continue;
    entries[name] = {S_ISDIR(status.st_mode), static_cast<std::uint64_t>(status.st_size)};
  }
  closedir(stream);
  return 0;
}

bool isSetAside(const std::string& name) {
  return name.starts_with('.') && name.ends_with(kAsideSuffix);
}

// Whether vald is asked if it is a marker.
bool mayBeMarker(const std::string& name) {
  return name.starts_with('.') && name.ends_with(".skein");
}

// The marker that stands on disk for a document that is not present. A long name's is
// shortened: then its first bytes tell it.
DiskEntries::iterator markerOf(DiskEntries& onDisk, const std::string& name) {
  const auto whole = onDisk.find('.' + name + ".skein");
  constexpr std::size_t kNeverCut = 190;
  if (whole != onDisk.end() || name.size() <= kNeverCut) return whole;
  const std::string beginning = '.' + name.substr(0, kNeverCut);
  const auto first = onDisk.lower_bound(beginning);
  const bool isMarker = first != onDisk.end() && first->first.starts_with(beginning) &&
                        first->first.ends_with(".skein");
  return isMarker ? first : onDisk.end();
}

// Whether it stands beside the present document that it is named after.
bool isLeftMarker(const std::string& name, const NSFileProviderItems& items) {
  return mayBeMarker(name) &&
         std::any_of(items.begin(), items.end(), [&](const NSFileProviderItemPtr& item) {
           return item->isDownloaded() && '.' + item->filename() + ".skein" == name;
         });
}

std::string joined(const std::string& folder, const std::string& name) {
  return folder == "/" ? folder + name : folder + '/' + name;
}

HostDifference::Kind kindOf(IndexDifference::Kind kind) {
  switch (kind) {
    case IndexDifference::Kind::MissingInIndex: return HostDifference::Kind::MissingInIndex;
    case IndexDifference::Kind::MissingInStore: return HostDifference::Kind::MissingInStore;
    case IndexDifference::Kind::Attributes: return HostDifference::Kind::Attributes;
    case IndexDifference::Kind::Identity: return HostDifference::Kind::Identity;
  }
  return HostDifference::Kind::Attributes;
}

}  // namespace

// One piece at a time: each begins when the one before has answered.
class StoreCheck::Work final : public std::enable_shared_from_this<Work> {
 public:
  using StepReply = Reply<HostCheckStep, NSErrorPtr>;

  Work(std::shared_ptr<FileProviderHost> host, DaemonProxies daemon, bool quick)
      : _host(std::move(host)),
        _daemon(std::move(daemon)),
        _quick(quick),
        _queue("store-check", tools().executor) {
    _folders.push_back({NSFileProviderRootContainerItemIdentifier, "", "/"});
  }

  void next(StepReply reply) {
    _queue.async([self = shared_from_this(), reply = std::move(reply)]() mutable {
      self->_queue.assumeCurrent();
      self->_waiting.push_back(std::move(reply));
      self->go();
    });
  }

  // Nobody waits for more.
  void stop() {
    _queue.async([self = shared_from_this()] {
      self->_queue.assumeCurrent();
      self->_stopped = true;
      self->_folders.clear();
      self->_unlisted.clear();
      self->_markers.clear();
    });
  }

 private:
  struct Folder {
    NSFileProviderItemIdentifier identifier;
    std::string diskPath;  // empty: the extension has to be asked
    std::string drivePath;
  };
  struct Look {
    Folder folder;
    std::set<std::string> leftOut;  // folders that are no part of the drive, by their paths
    int number = 0;
    NSFileProviderItems items;
    std::shared_ptr<Listing> listing;
    std::vector<std::string> markers;   // absolute paths
    std::vector<std::string> unlisted;  // folders that are in no listing, such as the trash
  };

  const HostTools& tools() const { return _host->tools(); }

  void go() SKEIN_REQUIRES(_queue) {
    if (_busy || _waiting.empty()) return;
    if (!_found.empty()) {
      answer({}, nullptr);
    } else if (!std::exchange(_askedDaemon, true)) {
      askDaemon();
    } else if (!_markers.empty()) {
      verify();
    } else if (_folders.empty() && !_unlisted.empty()) {
      _busy = true;
      tools().executor->post([self = shared_from_this(), path = std::move(_unlisted.back())] {
        self->lookIntoUnlisted(path);
      });
      _unlisted.pop_back();
    } else if (_folders.empty()) {
      HostCheckStep step;
      step.finished = true;
      answer(std::move(step), nullptr);
    } else {
      auto look = std::make_shared<Look>();
      look->folder = std::move(_folders.back());
      look->leftOut = _leftOut;
      _folders.pop_back();
      _busy = true;
      tools().executor->post([self = shared_from_this(), look] { self->list(look); });
    }
  }

  // What was found and does not fit is told to the next who asks.
  void answer(HostCheckStep step, NSErrorPtr error) SKEIN_REQUIRES(_queue) {
    _busy = false;
    std::move(step.differences.begin(), step.differences.end(), std::back_inserter(_found));
    step.differences.clear();
    AnswerRoom room;
    while (!_found.empty() &&
           room.take(_found.front().path.size() + _found.front().detail.size())) {
      step.differences.push_back(std::move(_found.front()));
      _found.pop_front();
    }
    step.folders = _folderCount;
    step.items = _itemCount;
    step.verified = _verified;
    step.verifiedBytes = _verifiedBytes;
    auto reply = std::move(_waiting.front());
    _waiting.pop_front();
    reply(std::move(step), std::move(error));
    go();
  }

  void answerLater(HostCheckStep step, NSErrorPtr error) {
    _queue.async([self = shared_from_this(), step = std::move(step), error]() mutable {
      self->_queue.assumeCurrent();
      self->answer(std::move(step), std::move(error));
    });
  }

  void askDaemon() SKEIN_REQUIRES(_queue) {
    _busy = true;
    const auto self = shared_from_this();
    _daemon([self](NSErrorPtr error) {
      self->answerLater({}, std::move(error));
    })->status([self](const LocalDaemonStatus& status, NSErrorPtr error) {
      if (error) return self->answerLater({}, std::move(error));
      self->_queue.async([self, notes = status.notes] {
        self->_queue.assumeCurrent();
        for (const std::string& note : notes) {
          if (auto path = pathLeftOut(note)) self->_leftOut.insert(std::move(*path));
        }
        self->checkIndex();
      });
    });
  }

  void checkIndex() SKEIN_REQUIRES(_queue) {
    const auto self = shared_from_this();
    _daemon([self](NSErrorPtr error) { self->answerLater({}, std::move(error)); })
        ->checkIndex(kMostDifferences,
                     [self](const std::vector<IndexDifference>& found, NSErrorPtr error) {
                       HostCheckStep step;
                       for (const IndexDifference& difference : found) {
                         step.differences.push_back(
                             {kindOf(difference.kind), difference.path, difference.detail});
                       }
                       self->answerLater(std::move(step), std::move(error));
                     });
  }

  void verify() SKEIN_REQUIRES(_queue) {
    _busy = true;
    const auto self = shared_from_this();
    std::vector<std::string> asked;
    std::size_t bytes = 0;
    for (const std::string& marker : _markers) {
      bytes += marker.size();
      if (!asked.empty() && (asked.size() == kMostMarkers || bytes > kMostMarkerBytes)) break;
      asked.push_back(marker);
    }
    _daemon([self](NSErrorPtr error) { self->answerLater({}, std::move(error)); })
        ->cloud()
        .verify(std::move(asked), _quick,
                [self](LocalCloudVerification verification, NSErrorPtr error) {
                  self->_queue.async([self, verification = std::move(verification), error] {
                    self->_queue.assumeCurrent();
                    self->didVerify(verification, error);
                  });
                });
  }

  void didVerify(const LocalCloudVerification& verification, const NSErrorPtr& error)
      SKEIN_REQUIRES(_queue) {
    // At least one, or this would never end.
    const std::size_t done =
        error ? 0 : std::clamp<std::size_t>(verification.done, 1, _markers.size());
    _markers.erase(_markers.begin(), _markers.begin() + static_cast<std::ptrdiff_t>(done));
    _verified += done;
    _verifiedBytes += verification.bytes;
    HostCheckStep step;
    for (const LocalCloudFault& fault : verification.faults) {
      step.differences.push_back({HostDifference::Kind::Contents, fault.path, fault.why});
    }
    answer(std::move(step), error);
  }

  void noteUnlisted(const std::vector<std::string>& markers,
                    const std::vector<std::string>& folders) SKEIN_REQUIRES(_queue) {
    if (_stopped) return;
    _markers.insert(_markers.end(), markers.begin(), markers.end());
    _unlisted.insert(_unlisted.end(), folders.begin(), folders.end());
  }

  void lookIntoUnlisted(const std::string& path) {
    DiskEntries entries;
    readFolder(path, entries);  // what cannot be read is in no index either
    std::vector<std::string> markers;
    std::vector<std::string> folders;
    for (const auto& [name, entry] : entries) {
      if (entry.isFolder) {
        folders.push_back(joined(path, name));
      } else if (mayBeMarker(name)) {
        markers.push_back(joined(path, name));
      }
    }
    _queue.async(
        [self = shared_from_this(), markers = std::move(markers), folders = std::move(folders)] {
          self->_queue.assumeCurrent();
          self->noteUnlisted(markers, folders);
          self->answer({}, nullptr);
        });
  }

  void list(const std::shared_ptr<Look>& look) {
    if (look->folder.diskPath.empty()) {
      const NSURLPtr url =
          _host->extension().URLForItemWithPersistentIdentifier(look->folder.identifier);
      if (url) look->folder.diskPath = url->path();
    }
    _host->list(
        look->folder.identifier, NSFileProviderInitialPageSortedByName(),
        [self = shared_from_this(), look](std::shared_ptr<Listing> listing, NSErrorPtr error) {
          look->items.clear();
          look->listing = std::move(listing);
          if (error) {
            self->couldNotList(look, error);
          } else {
            self->pull(look);
          }
        });
  }

  void pull(const std::shared_ptr<Look>& look) {
    look->listing->next(
        [self = shared_from_this(), look](NSFileProviderItems items, bool last, NSErrorPtr error) {
          look->items.insert(look->items.end(), items.begin(), items.end());
          if (error) {
            self->couldNotList(look, error);
          } else if (last) {
            self->compare(look);
          } else {
            self->pull(look);
          }
        });
  }

  void couldNotList(const std::shared_ptr<Look>& look, const NSErrorPtr& error) {
    const bool missing = error->domain() == NSFileProviderErrorDomain &&
                         error->code() == NSFileProviderErrorNoSuchItem;
    if (!missing) {
      answerLater({}, error);
      return;
    }
    struct stat status {};
    if (look->folder.drivePath != "/" && lstat(look->folder.diskPath.c_str(), &status) != 0) {
      answerLater({}, nullptr);  // it went meanwhile, from both
      return;
    }
    settle(look, {{HostDifference::Kind::Listing, look->folder.drivePath,
                   "the folder is on disk, but cannot be listed"}});
  }

  void compare(const std::shared_ptr<Look>& look) {
    const Folder& folder = look->folder;
    const bool isRoot = folder.drivePath == "/";
    DiskEntries onDisk;
    std::vector<HostDifference> differences;
    const int problem = readFolder(folder.diskPath, onDisk);
    std::erase_if(onDisk, [&](const auto& entry) {
      return look->leftOut.contains(joined(folder.diskPath, entry.first));
    });
    look->markers.clear();
    look->unlisted.clear();
    for (const auto& [name, entry] : onDisk) {
      if (!entry.isFolder && mayBeMarker(name)) {
        look->markers.push_back(joined(folder.diskPath, name));
      } else if (entry.isFolder && useOfReservedName(name) != nullptr) {
        look->unlisted.push_back(joined(folder.diskPath, name));
      }
    }
    if (problem != 0 && problem != EACCES) {
      differences.push_back({HostDifference::Kind::OnlyInListing, folder.drivePath,
                             std::string("the folder cannot be read: ") + std::strerror(problem)});
    }
    std::vector<Folder> subfolders;
    for (const NSFileProviderItemPtr& item : look->items) {
      const std::string name = item->filename();
      const std::string path = joined(folder.drivePath, name);
      const auto* known = dynamic_cast<const VLQueryItem*>(item.get());
      // An app's container is listed at the root, and lies elsewhere.
      const bool elsewhere =
          isRoot && known != nullptr && known->properties().containerID && !onDisk.contains(name);
      if (item->isFolder()) {
        subfolders.push_back({item->itemIdentifier(),
                              elsewhere ? std::string() : joined(folder.diskPath, name), path});
      }
      if (elsewhere || problem == EACCES) continue;
      const auto entry = item->isDownloaded() ? onDisk.find(name) : markerOf(onDisk, name);
      if (entry == onDisk.end()) {
        differences.push_back({HostDifference::Kind::OnlyInListing, path,
                               "listed, but not on disk (or listed twice)"});
        continue;
      }
      if (entry->second.isFolder != item->isFolder()) {
        differences.push_back({HostDifference::Kind::Listing, path,
                               item->isFolder() ? "listed as a folder, is none on disk"
                                                : "a folder on disk, listed as none"});
      } else if (known != nullptr && known->properties().kind == VLQueryItem::Kind::Document &&
                 item->isDownloaded() && item->documentSize() != entry->second.size) {
        differences.push_back({HostDifference::Kind::Listing, path,
                               "listed with " + std::to_string(item->documentSize().value_or(0)) +
                                   " bytes, has " + std::to_string(entry->second.size)});
      }
      onDisk.erase(entry);
    }
    for (const auto& [name, entry] : onDisk) {
      if (isSetAside(name)) {
        differences.push_back({HostDifference::Kind::MissingInListing,
                               joined(folder.drivePath, name),
                               "a document that an interrupted eviction set aside; get or evict "
                               "the document, or rename this file to its name"});
      }
      if (useOfReservedName(name) != nullptr) continue;  // vald leaves it out, too
      differences.push_back(
          {HostDifference::Kind::MissingInListing, joined(folder.drivePath, name),
           isLeftMarker(name, look->items)
               ? "the marker of an evicted document whose name another file took; "
                 "rename this file, and that document is listed under the new "
                 "name"
               : "on disk, but not listed"});
    }
    if (!differences.empty()) {
      settle(look, std::move(differences));
      return;
    }
    finish(look, std::move(subfolders), {});
  }

  // Looks again while the disk and vald may still be on their way to each other.
  void settle(const std::shared_ptr<Look>& look, std::vector<HostDifference> differences) {
    if (++look->number < kMostLooks) {
      tools().timers->after(kBetweenLooks, [self = shared_from_this(), look] { self->list(look); });
      return;
    }
    std::vector<Folder> subfolders;
    for (const NSFileProviderItemPtr& item : look->items) {
      if (!item->isFolder()) continue;
      subfolders.push_back(
          {item->itemIdentifier(), "", joined(look->folder.drivePath, item->filename())});
    }
    finish(look, std::move(subfolders), std::move(differences));
  }

  void finish(const std::shared_ptr<Look>& look, std::vector<Folder> subfolders,
              std::vector<HostDifference> differences) {
    _queue.async([self = shared_from_this(), look, subfolders = std::move(subfolders),
                  differences = std::move(differences)]() mutable {
      self->_queue.assumeCurrent();
      ++self->_folderCount;
      self->_itemCount += look->items.size();
      self->noteUnlisted(look->markers, look->unlisted);
      if (!self->_stopped) {
        for (Folder& folder : subfolders) self->_folders.push_back(std::move(folder));
      }
      HostCheckStep step;
      step.differences = std::move(differences);
      self->answer(std::move(step), nullptr);
    });
  }

  const std::shared_ptr<FileProviderHost> _host;
  const DaemonProxies _daemon;
  const bool _quick;
  SerialQueue _queue;
  bool _askedDaemon SKEIN_GUARDED_BY(_queue) = false;
  bool _busy SKEIN_GUARDED_BY(_queue) = false;
  bool _stopped SKEIN_GUARDED_BY(_queue) = false;
  std::vector<Folder> _folders SKEIN_GUARDED_BY(_queue);
  std::deque<HostDifference> _found SKEIN_GUARDED_BY(_queue);  // and not told of yet
  std::deque<StepReply> _waiting SKEIN_GUARDED_BY(_queue);
  std::set<std::string> _leftOut SKEIN_GUARDED_BY(_queue);
  std::uint64_t _folderCount SKEIN_GUARDED_BY(_queue) = 0;
  std::uint64_t _itemCount SKEIN_GUARDED_BY(_queue) = 0;
  std::deque<std::string> _markers SKEIN_GUARDED_BY(_queue);  // still to be verified
  std::vector<std::string> _unlisted SKEIN_GUARDED_BY(_queue);
  std::uint64_t _verified SKEIN_GUARDED_BY(_queue) = 0;
  std::uint64_t _verifiedBytes SKEIN_GUARDED_BY(_queue) = 0;
};

StoreCheck::StoreCheck(std::shared_ptr<FileProviderHost> host, DaemonProxies daemon, bool quick)
    : _work(std::make_shared<Work>(std::move(host), std::move(daemon), quick)) {}

StoreCheck::~StoreCheck() { _work->stop(); }

void StoreCheck::next(Reply<HostCheckStep, NSErrorPtr> reply) { _work->next(std::move(reply)); }

}  // namespace skein
