#pragma once

#include <memory>

#include "linux/host/ContentRequests.h"
#include "linux/host/DriveRequests.h"
#include "linux/host/Transfer.h"
#include "linux/protocol/HostFiles.h"

namespace skein {

// What the command line may ask about documents: the extension's operations, each in the
// name of whose request it is. Only what the extension has no operation for goes to vald.
// Every request is answered by the deadline; a transfer that was answered goes on.
class HostFileRequests final : public HostFiles {
 public:
  explicit HostFileRequests(std::shared_ptr<DriveRequests> drive);

  void contents(HostTarget target, bool currentVersion,
                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override;
  void evict(HostTarget target, Reply<NSErrorPtr> reply) override;
  void setPinned(HostTarget target, bool pinned, Reply<NSErrorPtr> reply) override;
  void importDocument(std::string source, HostTarget parent, RequestOrigin origin,
                      Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override;
  void createDirectory(std::string name, HostTarget parent, RequestOrigin origin,
                       ItemReply reply) override;
  void makeAlias(HostTarget target, bool outside, std::string name, HostTarget parent,
                 RequestOrigin origin, ItemReply reply) override;
  void rename(HostTarget target, std::string newName, RequestOrigin origin,
              ItemReply reply) override;
  void reparent(HostTarget target, HostTarget parent, std::optional<std::string> newName,
                RequestOrigin origin,
                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override;
  void trash(HostTarget target, RequestOrigin origin, ItemReply reply) override;
  void untrash(HostTarget target, std::optional<HostTarget> parent, RequestOrigin origin,
               ItemReply reply) override;
  void remove(HostTarget target, RequestOrigin origin,
              Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override;
  void trashedItems(Reply<std::shared_ptr<HostTrash>, NSErrorPtr> reply) override;
  void setTags(HostTarget target, std::vector<std::string> names, ItemReply reply) override;
  void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) override;
  void setFavoriteRank(HostTarget target, std::optional<std::int64_t> rank,
                       ItemReply reply) override;
  void setLastUsedDate(HostTarget target, std::optional<NSDate> date, ItemReply reply) override;
  void defaultContainer(std::optional<std::string> bundleIdentifier, ItemReply reply) override;
  void history(HostTarget target, std::uint64_t limit,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override;

 private:
  using TimedItem = std::shared_ptr<TimedReply<HostItem>>;

  // Runs `operation(extension, identifier, completion)` in the origin's name, and answers
  // with the item that the completion is given.
  template <class Operation>
  void change(HostTarget target, RequestOrigin origin, ItemReply reply, Operation operation);
  // Runs `operation(files, url, reply)` of vald's.
  template <class Operation>
  void askDaemon(HostTarget target, Reply<NSErrorPtr> reply, Operation operation);

  const std::shared_ptr<DriveRequests> _drive;
  const std::shared_ptr<ContentRequests> _contents;
};

}  // namespace skein
