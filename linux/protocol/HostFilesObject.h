#pragma once

#include <string>

#include "linux/protocol/HostPeer.h"
#include "linux/protocol/hostfiles.capnp.h"

namespace skein {

// The host's file operations, as one connection sees them: a part of the host's object.
// Lives on the loop's thread.
class HostFilesObject : public virtual wire::HostFiles::Server {
 public:
  explicit HostFilesObject(HostPeerPtr peer) : _peer(std::move(peer)) {}

  kj::Promise<void> contents(ContentsContext context) override;
  kj::Promise<void> evict(EvictContext context) override;
  kj::Promise<void> setPinned(SetPinnedContext context) override;
  kj::Promise<void> importDocument(ImportDocumentContext context) override;
  kj::Promise<void> createDirectory(CreateDirectoryContext context) override;
  kj::Promise<void> makeAlias(MakeAliasContext context) override;
  kj::Promise<void> rename(RenameContext context) override;
  kj::Promise<void> reparent(ReparentContext context) override;
  kj::Promise<void> trash(TrashContext context) override;
  kj::Promise<void> untrash(UntrashContext context) override;
  kj::Promise<void> remove(RemoveContext context) override;
  kj::Promise<void> trashedItems(TrashedItemsContext context) override;
  kj::Promise<void> setTags(SetTagsContext context) override;
  kj::Promise<void> tagsInUse(TagsInUseContext context) override;
  kj::Promise<void> setFavoriteRank(SetFavoriteRankContext context) override;
  kj::Promise<void> setLastUsedDate(SetLastUsedDateContext context) override;
  kj::Promise<void> defaultContainer(DefaultContainerContext context) override;
  kj::Promise<void> history(HistoryContext context) override;

 private:
  // Answers a call with what start(files, reply) gives.
  template <class Context, class Start, class Encode>
  kj::Promise<void> serve(Context context, Start start, Encode encode);

  template <class Params>
  std::string originOf(const Params& params) const;

  const HostPeerPtr _peer;
};

}  // namespace skein
