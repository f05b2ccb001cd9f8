#include "linux/host/HostFileRequests.h"

#include <chrono>
#include <functional>
#include <utility>

#include "linux/framework/RequestOrigin.h"
#include "linux/host/TrashPages.h"
#include "platform/fileprovider/FPTags.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

using Entries = std::vector<FileHistoryEntry>;
using ItemCompletion = NSFileProviderExtension::ItemCompletion;
using TimedTransfer = std::shared_ptr<TimedReply<std::shared_ptr<HostTransfer>>>;

// Some of the extension's operations may end with neither an item nor an error.
NSErrorPtr nothingAnsweredError() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFileWriteUnknownError,
      {{NSLocalizedDescriptionKey,
        "The operation ended without saying what became of the item; look at it with skein ls"}});
}

NSErrorPtr cancelledError() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSUserCancelledError,
      {{NSLocalizedDescriptionKey, std::string("The download was cancelled.")}});
}

// An item counts, whatever error is left beside it.
template <class Answer>
void answerWith(const DriveRequests& drive, Answer& answer, NSFileProviderItemPtr item,
                NSErrorPtr error) {
  if (item) {
    answer(drive.place(std::move(item)), nullptr);
  } else {
    answer(HostItem(), error ? std::move(error) : nothingAnsweredError());
  }
}

ItemCompletion completionFor(const std::shared_ptr<DriveRequests>& drive,
                             const std::shared_ptr<TimedReply<HostItem>>& timed) {
  return [drive, timed](NSFileProviderItemPtr item, NSErrorPtr error) {
    answerWith(*drive, *timed, std::move(item), std::move(error));
  };
}

// Answers with a transfer, which cancels what `start` starts; `start` ends it.
void startTransfer(const DriveRequests& drive, const RequestOrigin& origin,
                   const TimedTransfer& timed,
                   const std::function<void(const std::shared_ptr<Transfer>&,
                                            const std::shared_ptr<RequestProgress>&)>& start) {
  const auto transfer = std::make_shared<Transfer>(drive.tools());
  const auto progress = std::make_shared<RequestProgress>();
  const RequestOriginScope originScope(origin);
  const RequestProgressScope progressScope(progress);
  start(transfer, progress);
  (*timed)(streamOf(transfer, [progress] { progress->cancel(); }), nullptr);
}

void finishWith(const DriveRequests& drive, Transfer& transfer, NSFileProviderItemPtr item,
                NSErrorPtr error) {
  const auto finish = [&](HostItem placed, NSErrorPtr reason) {
    transfer.finish(std::move(placed), std::move(reason));
  };
  answerWith(drive, finish, std::move(item), std::move(error));
}

// Where the identifier's item is; null with an error.
NSURLPtr urlOf(const DriveRequests& drive, const HostTarget& target, NSErrorOut error) {
  const auto identifier = drive.resolve(target, error);
  if (!identifier) return nullptr;
  NSURLPtr url = drive.extension().URLForItemWithPersistentIdentifier(*identifier);
  if (!url) error.store(fileProviderErrorForNonExistentItemWithIdentifier(*identifier));
  return url;
}

// The item that an import left in the folder under the source's name; null when there is none.
NSFileProviderItemPtr importedItem(const DriveRequests& drive, const std::string& source,
                                   const NSFileProviderItemIdentifier& parent) {
  NSFileProviderExtension& extension = drive.extension();
  const NSURLPtr folder = extension.URLForItemWithPersistentIdentifier(parent);
  if (!folder) return nullptr;
  const std::string name = NSURL::fileURLWithPath(source)->lastPathComponent();
  const auto identifier =
      extension.persistentIdentifierForItemAtURL(folder->URLByAppendingPathComponent(name));
  return identifier ? extension.itemForIdentifier(*identifier, nullptr) : nullptr;
}

NSFileProviderItemPtr collidingItem(const NSErrorPtr& error) {
  if (!error || error->code() != NSFileProviderErrorFilenameCollision) return nullptr;
  const auto entry = error->userInfo().find(NSFileProviderErrorCollidingItemKey);
  if (entry == error->userInfo().end()) return nullptr;
  const auto* item = std::get_if<NSFileProviderItemPtr>(&entry->second);
  return item != nullptr ? *item : nullptr;
}

// Where the target's path lies on the disk, whether or not something is there; of an
// identifier that names nothing, empty.
std::string absolutePath(const DriveRequests& drive, const HostTarget& target, NSErrorOut error) {
  if (target.kind == HostTarget::Kind::Identifier) {
    const NSURLPtr url = drive.extension().URLForItemWithPersistentIdentifier(target.text);
    return url ? url->path() : "";
  }
  const NSURLPtr url = drive.paths().urlForPath(target.text, error);
  return url ? url->path() : "";
}

void placeInDrive(const DriveRequests& drive, FileHistoryEntry& entry) {
  const auto place = [&](std::string& path) {
    auto inDrive = drive.paths().pathForURL(NSURL::fileURLWithPath(path));
    if (inDrive) path = std::move(*inDrive);
  };
  if (entry.operation != "import") place(entry.path);
  if (!entry.destination.empty()) place(entry.destination);
}

void askHistory(const DriveRequests& drive, const std::shared_ptr<TimedReply<Entries>>& timed,
                const std::string& path, const std::string& identifier, std::uint64_t limit,
                Reply<Entries, NSErrorPtr> reply) {
  drive.daemon()(failing(timed))->files().history(path, identifier, limit, std::move(reply));
}

}  // namespace

HostFileRequests::HostFileRequests(std::shared_ptr<DriveRequests> drive)
    : _drive(std::move(drive)), _contents(std::make_shared<ContentRequests>(_drive->extension())) {}

template <class Operation>
void HostFileRequests::change(HostTarget target, RequestOrigin origin, ItemReply reply,
                              Operation operation) {
  _drive->withDrive<HostItem>(
      std::move(reply),
      [drive = _drive, target = std::move(target), origin = std::move(origin),
       operation = std::move(operation)](const TimedItem& timed) mutable {
        NSErrorPtr error;
        const auto identifier = drive->resolve(target, &error);
        if (!identifier) {
          (*timed)({}, error);
          return;
        }
        const RequestOriginScope scope(origin);
        operation(*drive, *identifier, completionFor(drive, timed));
      },
      deadlines::kLongRequest);
}

template <class Operation>
void HostFileRequests::askDaemon(HostTarget target, Reply<NSErrorPtr> reply, Operation operation) {
  _drive->withDrive<>(std::move(reply), [drive = _drive, target = std::move(target),
                                         operation = std::move(operation)](
                                            const std::shared_ptr<TimedReply<>>& timed) {
    NSErrorPtr error;
    const NSURLPtr url = urlOf(*drive, target, &error);
    if (!url) {
      (*timed)(error);
      return;
    }
    operation(drive->daemon()(failing(timed))->files(), url,
              [timed](NSErrorPtr problem) { (*timed)(std::move(problem)); });
  });
}

void HostFileRequests::contents(HostTarget target, bool currentVersion,
                                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostTransfer>>(
      std::move(reply), [drive = _drive, contents = _contents, target = std::move(target),
                         currentVersion](const TimedTransfer& timed) {
        NSErrorPtr error;
        const auto identifier = drive->resolve(target, &error);
        const NSURLPtr url =
            identifier ? drive->extension().URLForItemWithPersistentIdentifier(*identifier)
                       : nullptr;
        if (!url) {
          if (!error) error = fileProviderErrorForNonExistentItemWithIdentifier(identifier);
          (*timed)(nullptr, error);
          return;
        }
        const auto transfer = std::make_shared<Transfer>(drive->tools());
        auto want = contents->provide(
            url, currentVersion, [drive, transfer, identifier](NSErrorPtr problem) {
              HostItem item;
              if (!problem) {
                item = drive->place(drive->extension().itemForIdentifier(*identifier, &problem));
              }
              transfer->finish(std::move(item), std::move(problem));
            });
        transfer->follow(want->progress());
        const auto letGo = [transfer, want = std::move(want)]() mutable {
          want = nullptr;
          transfer->finish({}, cancelledError());
        };
        (*timed)(streamOf(transfer, letGo), nullptr);
      });
}

void HostFileRequests::evict(HostTarget target, Reply<NSErrorPtr> reply) {
  _drive->withDrive<>(
      std::move(reply),
      [drive = _drive, contents = _contents,
       target = std::move(target)](const std::shared_ptr<TimedReply<>>& timed) {
        NSErrorPtr error;
        const NSURLPtr url = urlOf(*drive, target, &error);
        if (url) error = contents->evict(url);
        (*timed)(error);
      },
      deadlines::kLongRequest);
}

void HostFileRequests::setPinned(HostTarget target, bool pinned, Reply<NSErrorPtr> reply) {
  askDaemon(std::move(target), std::move(reply),
            [pinned](LocalFiles& files, const NSURLPtr& url, Reply<NSErrorPtr> done) {
              files.setPinned(url, pinned, std::move(done));
            });
}

void HostFileRequests::importDocument(std::string source, HostTarget parent, RequestOrigin origin,
                                      Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostTransfer>>(
      std::move(reply), [drive = _drive, source = std::move(source), parent = std::move(parent),
                         origin = std::move(origin)](const TimedTransfer& timed) {
        NSErrorPtr error;
        const auto folder = drive->resolve(parent, &error);
        if (!folder) {
          (*timed)(nullptr, error);
          return;
        }
        startTransfer(*drive, origin, timed, [&](const auto& transfer, const auto& progress) {
          transfer->follow(progress);
          drive->extension().importDocumentAtURL(
              NSURL::fileURLWithPath(source), *folder,
              [drive, transfer, source, folder](NSFileProviderItemPtr item, NSErrorPtr problem) {
                // The extension does not say why it found no item after the import.
                if (!item && !problem) item = importedItem(*drive, source, *folder);
                finishWith(*drive, *transfer, std::move(item), std::move(problem));
              });
        });
      });
}

void HostFileRequests::createDirectory(std::string name, HostTarget parent, RequestOrigin origin,
                                       ItemReply reply) {
  change(std::move(parent), std::move(origin), std::move(reply),
         [name = std::move(name)](const DriveRequests& drive,
                                  const NSFileProviderItemIdentifier& identifier,
                                  ItemCompletion completion) {
           drive.extension().createDirectoryWithName(name, identifier, std::move(completion));
         });
}

void HostFileRequests::makeAlias(HostTarget target, bool outside, std::string name,
                                 HostTarget parent, RequestOrigin origin, ItemReply reply) {
  _drive->withDrive<HostItem>(
      std::move(reply),
      [drive = _drive, target = std::move(target), outside, name = std::move(name),
       parent = std::move(parent), origin = std::move(origin)](const TimedItem& timed) {
        NSErrorPtr error;
        const NSURLPtr url =
            outside ? NSURL::fileURLWithPath(target.text) : urlOf(*drive, target, &error);
        const NSURLPtr folder = url ? urlOf(*drive, parent, &error) : nullptr;
        if (!folder) {
          (*timed)({}, error);
          return;
        }
        // Looked up with vald, too: the extension answers with an alias's target.
        drive->daemon()(failing(timed))
            ->files()
            .makeAlias(folder, name, url->path(), origin,
                       [drive, timed](const NSURLPtr& made, NSErrorPtr problem) {
                         if (!made) {
                           (*timed)({}, std::move(problem));
                           return;
                         }
                         drive->daemon()(failing(timed))
                             ->queryItemForURL(
                                 made, true,
                                 [drive, timed](const VLQueryItemPtr& item, NSErrorPtr lost) {
                                   answerWith(*drive, *timed, item, std::move(lost));
                                 });
                       });
      });
}

void HostFileRequests::rename(HostTarget target, std::string newName, RequestOrigin origin,
                              ItemReply reply) {
  change(std::move(target), std::move(origin), std::move(reply),
         [name = std::move(newName)](const DriveRequests& drive,
                                     const NSFileProviderItemIdentifier& identifier,
                                     ItemCompletion completion) {
           drive.extension().renameItemWithIdentifier(identifier, name, std::move(completion));
         });
}

void HostFileRequests::reparent(HostTarget target, HostTarget parent,
                                std::optional<std::string> newName, RequestOrigin origin,
                                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostTransfer>>(
      std::move(reply),
      [drive = _drive, target = std::move(target), parent = std::move(parent),
       name = std::move(newName), origin = std::move(origin)](const TimedTransfer& timed) {
        NSErrorPtr error;
        const auto identifier = drive->resolve(target, &error);
        std::optional<NSFileProviderItemIdentifier> folder;
        if (identifier) folder = drive->resolve(parent, &error);
        if (!folder) {
          (*timed)(nullptr, error);
          return;
        }
        startTransfer(*drive, origin, timed, [&](const auto& transfer, const auto& progress) {
          transfer->follow(progress);
          drive->extension().reparentItemWithIdentifier(
              *identifier, *folder, name,
              [drive, transfer](NSFileProviderItemPtr item, NSErrorPtr problem) {
                finishWith(*drive, *transfer, std::move(item), std::move(problem));
              });
        });
      });
}

void HostFileRequests::trash(HostTarget target, RequestOrigin origin, ItemReply reply) {
  change(std::move(target), std::move(origin), std::move(reply),
         [](const DriveRequests& drive, const NSFileProviderItemIdentifier& identifier,
            ItemCompletion completion) {
           drive.extension().trashItemWithIdentifier(identifier, std::move(completion));
         });
}

void HostFileRequests::untrash(HostTarget target, std::optional<HostTarget> parent,
                               RequestOrigin origin, ItemReply reply) {
  change(std::move(target), std::move(origin), std::move(reply),
         [parent = std::move(parent)](const DriveRequests& drive,
                                      const NSFileProviderItemIdentifier& identifier,
                                      ItemCompletion completion) {
           NSErrorPtr error;
           std::optional<NSFileProviderItemIdentifier> folder;
           if (parent) folder = drive.resolve(*parent, &error);
           // The extension falls back to where the item was; a folder that somebody named and
           // that is not there is an error.
           if (parent && !folder) {
             completion(nullptr, error);
             return;
           }
           drive.extension().untrashItemWithIdentifier(identifier, folder, std::move(completion));
         });
}

void HostFileRequests::remove(HostTarget target, RequestOrigin origin,
                              Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostTransfer>>(
      std::move(reply), [drive = _drive, target = std::move(target),
                         origin = std::move(origin)](const TimedTransfer& timed) {
        NSErrorPtr error;
        const auto identifier = drive->resolve(target, &error);
        if (!identifier) {
          (*timed)(nullptr, error);
          return;
        }
        startTransfer(*drive, origin, timed, [&](const auto& transfer, const auto&) {
          drive->extension().deleteItemWithIdentifier(*identifier, [transfer](NSErrorPtr problem) {
            transfer->finish({}, std::move(problem));
          });
        });
      });
}

void HostFileRequests::trashedItems(Reply<std::shared_ptr<HostTrash>, NSErrorPtr> reply) {
  _drive->withDrive<std::shared_ptr<HostTrash>>(
      std::move(reply),
      [drive = _drive](const std::shared_ptr<TimedReply<std::shared_ptr<HostTrash>>>& timed) {
        (*timed)(std::make_shared<TrashPages>(drive), nullptr);
      });
}

void HostFileRequests::setTags(HostTarget target, std::vector<std::string> names, ItemReply reply) {
  change(std::move(target), {}, std::move(reply),
         [names = std::move(names)](const DriveRequests& drive,
                                    const NSFileProviderItemIdentifier& identifier,
                                    ItemCompletion completion) {
           std::vector<FPTag> tags;
           for (const std::string& name : names) tags.push_back({name, FPTag::Color::None});
           const auto data = FPGetTagsDataFromTags(tags);
           if (!data) {
             completion(nullptr, vlc_errorInvalidParameter("tag", "an empty or endless name"));
             return;
           }
           drive.extension().setTagData(data, identifier, std::move(completion));
         });
}

void HostFileRequests::tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) {
  auto timed = TimedReply<std::vector<TagUse>>::begin(_drive->tools(), std::move(reply));
  _drive->daemon()(failing(timed))
      ->files()
      .tagsInUse(std::move(after), [timed](std::vector<TagUse> tags, NSErrorPtr error) {
        (*timed)(std::move(tags), std::move(error));
      });
}

void HostFileRequests::setFavoriteRank(HostTarget target, std::optional<std::int64_t> rank,
                                       ItemReply reply) {
  change(std::move(target), {}, std::move(reply),
         [rank](const DriveRequests& drive, const NSFileProviderItemIdentifier& identifier,
                ItemCompletion completion) {
           drive.extension().setFavoriteRank(rank, identifier, std::move(completion));
         });
}

void HostFileRequests::setLastUsedDate(HostTarget target, std::optional<NSDate> date,
                                       ItemReply reply) {
  change(std::move(target), {}, std::move(reply),
         [date](const DriveRequests& drive, const NSFileProviderItemIdentifier& identifier,
                ItemCompletion completion) {
           drive.extension().setLastUsedDate(date, identifier, std::move(completion));
         });
}

void HostFileRequests::defaultContainer(std::optional<std::string> bundleIdentifier,
                                        ItemReply reply) {
  _drive->withDrive<HostItem>(
      std::move(reply),
      [drive = _drive, bundle = std::move(bundleIdentifier)](const TimedItem& timed) {
        drive->extension()._defaultApplicationContainerForBundleIdentifier(
            bundle, [drive, timed](NSFileProviderItemPtr item, NSErrorPtr error) {
              // A Documents folder that is there already comes as the item it collides with.
              if (!item) item = collidingItem(error);
              answerWith(*drive, *timed, std::move(item), std::move(error));
            });
      });
}

void HostFileRequests::history(HostTarget target, std::uint64_t limit,
                               Reply<Entries, NSErrorPtr> reply) {
  _drive->withDrive<Entries>(
      std::move(reply), [drive = _drive, target = std::move(target),
                         limit](const std::shared_ptr<TimedReply<Entries>>& timed) {
        NSErrorPtr error;
        const std::string path = absolutePath(*drive, target, &error);
        if (error) {
          (*timed)({}, error);
          return;
        }
        const auto answer = [drive, timed](Entries entries, NSErrorPtr problem) {
          for (FileHistoryEntry& entry : entries) placeInDrive(*drive, entry);
          (*timed)(std::move(entries), std::move(problem));
        };
        const std::string identifier = drive->resolve(target, nullptr).value_or("");
        if (!identifier.empty()) {
          askHistory(*drive, timed, path, identifier, limit, answer);
          return;
        }
        // Nothing is there any more: what was there last is asked for.
        askHistory(*drive, timed, path, "", limit,
                   [drive, timed, path, limit, answer](Entries entries, NSErrorPtr problem) {
                     if (entries.empty() || entries.front().identifier.empty()) {
                       answer(std::move(entries), std::move(problem));
                       return;
                     }
                     askHistory(*drive, timed, path, entries.front().identifier, limit, answer);
                   });
      });
}

}  // namespace skein
