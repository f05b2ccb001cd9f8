// vald's file operations, as one connection sees them. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <cstddef>
#include <memory>

#include "linux/protocol/DaemonService.h"
#include "linux/protocol/FilesCodec.h"

namespace skein {

// The part of vald's object that has to do with files. Lives on the loop's thread.
class FilesObject : public virtual wire::Files::Server {
 public:
  explicit FilesObject(DaemonServicePtr service) : _service(std::move(service)) {}

  kj::Promise<void> importDocument(ImportDocumentContext context) override;
  kj::Promise<void> createFolder(CreateFolderContext context) override;
  kj::Promise<void> makeAlias(MakeAliasContext context) override;
  kj::Promise<void> rename(RenameContext context) override;
  kj::Promise<void> move(MoveContext context) override;
  kj::Promise<void> remove(RemoveContext context) override;
  kj::Promise<void> trash(TrashContext context) override;
  kj::Promise<void> putBackURL(PutBackURLContext context) override;
  kj::Promise<void> capabilityToMove(CapabilityToMoveContext context) override;
  kj::Promise<void> coordinateDeletion(CoordinateDeletionContext context) override;
  kj::Promise<void> physicalURL(PhysicalURLContext context) override;
  kj::Promise<void> setTagNames(SetTagNamesContext context) override;
  kj::Promise<void> setLastOpenDate(SetLastOpenDateContext context) override;
  kj::Promise<void> setFavoriteRank(SetFavoriteRankContext context) override;
  kj::Promise<void> tagsInUse(TagsInUseContext context) override;
  kj::Promise<void> download(DownloadContext context) override;
  kj::Promise<void> evict(EvictContext context) override;
  kj::Promise<void> setPinned(SetPinnedContext context) override;
  kj::Promise<void> trashedItems(TrashedItemsContext context) override;
  kj::Promise<void> history(HistoryContext context) override;

 private:
  LocalFiles& files() const { return _service->server->daemon->files(); }
  template <class Context, class Start>
  kj::Promise<void> answerURL(Context context, Start start);
  template <class Context, class Start>
  kj::Promise<void> startTransfer(Context context, Start start);

  const DaemonServicePtr _service;
  const std::shared_ptr<std::size_t> _transfers = std::make_shared<std::size_t>(0);
};

}  // namespace skein
