// What a person does to documents, as the command line asks skein-host for it. Stands on both
// sides of the socket, as HostService does; every change goes through the extension.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/HostTypes.h"
#include "linux/protocol/LocalFiles.h"

namespace skein {

// How far a transfer is; the last step has `finished` and the item.
struct HostTransferStep {
  std::uint64_t completedBytes = 0;
  std::uint64_t totalBytes = 0;  // 0 while nobody knows
  bool finished = false;
  HostItem item;
};
// A step when there is something new, at most every 100 ms, and the last one at once. Letting
// go cancels the transfer and waits for nothing; nothing of it is left.
class HostTransfer : public HostStream<HostTransferStep> {
 public:
  // Ends it; its last step tells whether that came in time (NSUserCancelledError) or what is
  // done. Any thread; returns at once.
  virtual void cancel() = 0;
};
using HostTrash = HostStream<std::vector<HostTrashedItem>, bool>;  // a page; whether it is the last

// Asynchronous: each reply runs once, on any thread but the caller's. An error comes with
// empty values. `origin` is whose request it is; see RequestOrigin.
class HostFiles {
 public:
  using ItemReply = Reply<HostItem, NSErrorPtr>;

  virtual ~HostFiles() = default;

  // Makes a document present (startProvidingItemAtURL). `currentVersion`: fetches although a
  // copy is there.
  virtual void contents(HostTarget target, bool currentVersion,
                        Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) = 0;
  // The reason of a refusal comes from vald: the extension only logs it, so this asks the
  // framework's file manager as the host's own file browser would.
  virtual void evict(HostTarget target, Reply<NSErrorPtr> reply) = 0;
  virtual void setPinned(HostTarget target, bool pinned, Reply<NSErrorPtr> reply) = 0;

  // `source` is an absolute path of this machine that skein-host can read: a file or a tree.
  virtual void importDocument(std::string source, HostTarget parent, RequestOrigin origin,
                              Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) = 0;
  virtual void createDirectory(std::string name, HostTarget parent, RequestOrigin origin,
                               ItemReply reply) = 0;
  // A reference to an item of the drive; `outside`: to an absolute path of this machine.
  virtual void makeAlias(HostTarget target, bool outside, std::string name, HostTarget parent,
                         RequestOrigin origin, ItemReply reply) = 0;
  virtual void rename(HostTarget target, std::string newName, RequestOrigin origin,
                      ItemReply reply) = 0;
  // Between volumes it takes long; cancelling leaves the item where it was, unless it has just
  // been moved.
  virtual void reparent(HostTarget target, HostTarget parent, std::optional<std::string> newName,
                        RequestOrigin origin,
                        Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) = 0;
  virtual void trash(HostTarget target, RequestOrigin origin, ItemReply reply) = 0;
  // Nil parent: where it was.
  virtual void untrash(HostTarget target, std::optional<HostTarget> parent, RequestOrigin origin,
                       ItemReply reply) = 0;
  // For good; the last step has no item. Until it is told, cancelling puts the item back.
  virtual void remove(HostTarget target, RequestOrigin origin,
                      Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) = 0;
  virtual void trashedItems(Reply<std::shared_ptr<HostTrash>, NSErrorPtr> reply) = 0;

  virtual void setTags(HostTarget target, std::vector<std::string> names, ItemReply reply) = 0;
  // A page, as LocalFiles::tagsInUse.
  virtual void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) = 0;
  virtual void setFavoriteRank(HostTarget target, std::optional<std::int64_t> rank,
                               ItemReply reply) = 0;
  virtual void setLastUsedDate(HostTarget target, std::optional<NSDate> date, ItemReply reply) = 0;

  // The folder where an app's documents go; nil: the drive's Documents, made if need be.
  virtual void defaultContainer(std::optional<std::string> bundleIdentifier, ItemReply reply) = 0;

  // What was done at a path of the drive, or to an identifier, newest first; at most `limit`.
  // Paths that lie in the drive begin at its root, but for the one an import came from.
  virtual void history(HostTarget target, std::uint64_t limit,
                       Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) = 0;
};

}  // namespace skein
