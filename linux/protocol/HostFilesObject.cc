#include "linux/protocol/HostFilesObject.h"

#include <string>
#include <vector>

#include "linux/protocol/HostFilesCodec.h"

namespace skein {
namespace {

class TransferObject final : public wire::HostTransfer::Server {
 public:
  TransferObject(HostPeerPtr peer, std::shared_ptr<HostTransfer> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(context,
                        [](auto results, const HostTransferStep& step, const NSErrorPtr& error) {
                          codec::encode(results, step);
                          codec::setError(results, error);
                        });
  }
  kj::Promise<void> cancel(CancelContext) override {
    _stream.run([](HostTransfer& transfer) { transfer.cancel(); });
    return kj::READY_NOW;
  }

 private:
  StreamOwner<HostTransfer> _stream;
};

class TrashObject final : public wire::HostTrash::Server {
 public:
  TrashObject(HostPeerPtr peer, std::shared_ptr<HostTrash> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(context, [](auto results, const std::vector<HostTrashedItem>& items,
                                    bool last, const NSErrorPtr& error) {
      auto list = results.initItems(static_cast<unsigned>(items.size()));
      unsigned at = 0;
      for (const HostTrashedItem& item : items) codec::encode(list[at++], item);
      results.setLast(last);
      codec::setError(results, error);
    });
  }

 private:
  StreamOwner<HostTrash> _stream;
};

constexpr auto encodeItem = [](auto results, const HostItem& item, const NSErrorPtr& error) {
  codec::encode(results.initItem(), item);
  codec::setError(results, error);
};

auto encodeTransfer(const HostPeerPtr& peer) {
  return [peer](auto results, std::shared_ptr<HostTransfer>& transfer, const NSErrorPtr& error) {
    if (transfer) results.setTransfer(kj::heap<TransferObject>(peer, std::move(transfer)));
    codec::setError(results, error);
  };
}

template <class List, class Values>
void encodeAll(List list, const Values& values) {
  unsigned at = 0;
  for (const auto& value : values) codec::encode(list[at++], value);
}

}  // namespace

template <class Context, class Start, class Encode>
kj::Promise<void> HostFilesObject::serve(Context context, Start start, Encode encode) {
  return answerOnExecutor(
      _peer, context,
      [service = _peer->service, start = std::move(start)](auto reply) mutable {
        start(service->files(), std::move(reply));
      },
      std::move(encode));
}

// Whose request it is, as the client says, with the process that the kernel says it is.
template <class Params>
std::string HostFilesObject::originOf(const Params& params) const {
  std::string origin = codec::text(params.getOrigin());
  const std::string process = "(process " + std::to_string(_peer->process) + ')';
  if (!origin.ends_with(process)) origin += (origin.empty() ? "" : " ") + process;
  return origin;
}

kj::Promise<void> HostFilesObject::contents(ContentsContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), current = params.getCurrentVersion()](
          HostFiles& files, auto reply) { files.contents(target, current, std::move(reply)); },
      encodeTransfer(_peer));
}

kj::Promise<void> HostFilesObject::evict(EvictContext context) {
  return serve(
      context,
      [target = codec::decode(context.getParams().getTarget())](HostFiles& files, auto reply) {
        files.evict(target, std::move(reply));
      },
      encodeError);
}

kj::Promise<void> HostFilesObject::setPinned(SetPinnedContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), pinned = params.getPinned()](
          HostFiles& files, auto reply) { files.setPinned(target, pinned, std::move(reply)); },
      encodeError);
}

kj::Promise<void> HostFilesObject::importDocument(ImportDocumentContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [source = codec::text(params.getSource()), parent = codec::decode(params.getParent()),
       origin = originOf(params)](HostFiles& files, auto reply) {
        files.importDocument(source, parent, origin, std::move(reply));
      },
      encodeTransfer(_peer));
}

kj::Promise<void> HostFilesObject::createDirectory(CreateDirectoryContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [name = codec::text(params.getName()), parent = codec::decode(params.getParent()),
       origin = originOf(params)](HostFiles& files, auto reply) {
        files.createDirectory(name, parent, origin, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::makeAlias(MakeAliasContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), outside = params.getOutside(),
       name = codec::text(params.getName()), parent = codec::decode(params.getParent()),
       origin = originOf(params)](HostFiles& files, auto reply) {
        files.makeAlias(target, outside, name, parent, origin, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::rename(RenameContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), name = codec::text(params.getNewName()),
       origin = originOf(params)](HostFiles& files, auto reply) {
        files.rename(target, name, origin, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::reparent(ReparentContext context) {
  const auto params = context.getParams();
  std::optional<std::string> name;
  if (params.hasNewName()) name = codec::text(params.getNewName());
  return serve(
      context,
      [target = codec::decode(params.getTarget()), parent = codec::decode(params.getParent()),
       name = std::move(name), origin = originOf(params)](HostFiles& files, auto reply) {
        files.reparent(target, parent, name, origin, std::move(reply));
      },
      encodeTransfer(_peer));
}

kj::Promise<void> HostFilesObject::trash(TrashContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), origin = originOf(params)](
          HostFiles& files, auto reply) { files.trash(target, origin, std::move(reply)); },
      encodeItem);
}

kj::Promise<void> HostFilesObject::untrash(UntrashContext context) {
  const auto params = context.getParams();
  std::optional<HostTarget> parent;
  if (params.hasParent()) parent = codec::decode(params.getParent());
  return serve(
      context,
      [target = codec::decode(params.getTarget()), parent = std::move(parent),
       origin = originOf(params)](HostFiles& files, auto reply) {
        files.untrash(target, parent, origin, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::remove(RemoveContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), origin = originOf(params)](
          HostFiles& files, auto reply) { files.remove(target, origin, std::move(reply)); },
      encodeTransfer(_peer));
}

kj::Promise<void> HostFilesObject::trashedItems(TrashedItemsContext context) {
  return serve(
      context, [](HostFiles& files, auto reply) { files.trashedItems(std::move(reply)); },
      [peer = _peer](auto results, std::shared_ptr<HostTrash>& trash, const NSErrorPtr& error) {
        if (trash) results.setTrash(kj::heap<TrashObject>(peer, std::move(trash)));
        codec::setError(results, error);
      });
}

kj::Promise<void> HostFilesObject::setTags(SetTagsContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), names = codec::decode(params.getNames())](
          HostFiles& files, auto reply) { files.setTags(target, names, std::move(reply)); },
      encodeItem);
}

kj::Promise<void> HostFilesObject::tagsInUse(TagsInUseContext context) {
  return serve(
      context,
      [after = codec::text(context.getParams().getAfter())](HostFiles& files, auto reply) {
        files.tagsInUse(after, std::move(reply));
      },
      [](auto results, const std::vector<TagUse>& tags, const NSErrorPtr& error) {
        encodeAll(results.initTags(static_cast<unsigned>(tags.size())), tags);
        codec::setError(results, error);
      });
}

kj::Promise<void> HostFilesObject::setFavoriteRank(SetFavoriteRankContext context) {
  const auto params = context.getParams();
  std::optional<std::int64_t> rank;
  if (params.getHasRank()) rank = params.getRank();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), rank](HostFiles& files, auto reply) {
        files.setFavoriteRank(target, rank, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::setLastUsedDate(SetLastUsedDateContext context) {
  const auto params = context.getParams();
  std::optional<NSDate> date;
  if (params.getHasDate()) date = codec::date(params.getDate());
  return serve(
      context,
      [target = codec::decode(params.getTarget()), date](HostFiles& files, auto reply) {
        files.setLastUsedDate(target, date, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::defaultContainer(DefaultContainerContext context) {
  const auto params = context.getParams();
  std::optional<std::string> bundle;
  if (params.hasBundleIdentifier()) bundle = codec::text(params.getBundleIdentifier());
  return serve(
      context,
      [bundle = std::move(bundle)](HostFiles& files, auto reply) {
        files.defaultContainer(bundle, std::move(reply));
      },
      encodeItem);
}

kj::Promise<void> HostFilesObject::history(HistoryContext context) {
  const auto params = context.getParams();
  return serve(
      context,
      [target = codec::decode(params.getTarget()), limit = params.getLimit()](
          HostFiles& files, auto reply) { files.history(target, limit, std::move(reply)); },
      [](auto results, const std::vector<FileHistoryEntry>& entries, const NSErrorPtr& error) {
        encodeAll(results.initEntries(static_cast<unsigned>(entries.size())), entries);
        codec::setError(results, error);
      });
}

}  // namespace skein
