#include "linux/protocol/FilesObject.h"

#include <algorithm>
#include <utility>

#include "linux/protocol/Answer.h"
#include "linux/protocol/TransferObject.h"
#include "linux/protocol/WithFaults.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// What one connection may have and one call may ask for.
// Each keeps a call open, and these count against what a peer may leave unanswered.
constexpr std::size_t kMostTransfers = 256;

constexpr auto encodeURL = [](auto results, const NSURLPtr& url, const NSErrorPtr& error) {
  if (url) results.setUrl(codec::bytes(url->path()));
  codec::setError(results, error);
};

// All of `values`, into a list as long as that.
void encodeList(auto list, const auto& values) {
  unsigned at = 0;
  for (const auto& value : values) codec::encode(list[at++], value);
}

// For a transfer that answers with no URL.
Reply<NSErrorPtr> errorAlone(LocalFiles::URLReply reply) {
  return [reply = std::move(reply)](NSErrorPtr error) mutable { reply(nullptr, std::move(error)); };
}

std::optional<std::string> nameOf(bool there, capnp::Data::Reader name) {
  return there ? std::optional(codec::text(name)) : std::nullopt;
}

}  // namespace

template <class Context, class Start>
kj::Promise<void> FilesObject::answerURL(Context context, Start start) {
  return answer(_service, context, std::move(start), encodeURL);
}

template <class Context, class Start>
kj::Promise<void> FilesObject::startTransfer(Context context, Start start) {
  KJ_REQUIRE(context.getParams().hasObserver(), "nobody to tell");
  KJ_REQUIRE(*_transfers < kMostTransfers, "this client has too many transfers");
  KJ_REQUIRE(_service->unanswered < DaemonService::kMostUnanswered,
             "too many calls are unanswered");
  LocalFiles::URLReply reply;
  auto transfer = RunningTransfer::begin(_service, reply);
  transfer->progress = start(std::move(reply));
  context.getResults().setTransfer(kj::heap<WithFaults<TransferObject>>(
      _service, std::move(transfer), context.getParams().getObserver(), _transfers));
  return kj::READY_NOW;
}

kj::Promise<void> FilesObject::importDocument(ImportDocumentContext context) {
  const auto params = context.getParams();
  return startTransfer(context, [&](auto reply) {
    return files().importDocument(urlFromClient(params.getSource()),
                                  urlFromClient(params.getFolder()),
                                  nameOf(params.hasName(), params.getName()),
                                  codec::text(params.getOrigin()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::createFolder(CreateFolderContext context) {
  const auto params = context.getParams();
  return answerURL(context, [&](auto reply) {
    files().createFolder(urlFromClient(params.getFolder()), codec::text(params.getName()),
                         codec::text(params.getOrigin()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::makeAlias(MakeAliasContext context) {
  const auto params = context.getParams();
  return answerURL(context, [&](auto reply) {
    files().makeAlias(urlFromClient(params.getFolder()), codec::text(params.getName()),
                      codec::text(params.getTarget()), codec::text(params.getOrigin()),
                      std::move(reply));
  });
}

kj::Promise<void> FilesObject::rename(RenameContext context) {
  const auto params = context.getParams();
  return answerURL(context, [&](auto reply) {
    files().rename(itemURLFromClient(params), codec::text(params.getNewName()),
                   codec::text(params.getOrigin()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::move(MoveContext context) {
  const auto params = context.getParams();
  return startTransfer(context, [&](LocalFiles::URLReply reply) {
    return files().move(itemURLFromClient(params), urlFromClient(params.getFolder()),
                        nameOf(params.hasNewName(), params.getNewName()), params.getBounce(),
                        codec::text(params.getOrigin()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::remove(RemoveContext context) {
  const auto params = context.getParams();
  return startTransfer(context, [&](LocalFiles::URLReply reply) {
    return files().remove(itemURLFromClient(params), codec::text(params.getOrigin()),
                          errorAlone(std::move(reply)));
  });
}

kj::Promise<void> FilesObject::trash(TrashContext context) {
  const auto params = context.getParams();
  return answerURL(context, [&](auto reply) {
    files().trash(itemURLFromClient(params), codec::text(params.getOrigin()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::putBackURL(PutBackURLContext context) {
  return answerURL(context, [&](auto reply) {
    files().putBackURL(urlFromClient(context.getParams().getUrl()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::capabilityToMove(CapabilityToMoveContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        files().capabilityToMove(urlFromClient(params.getUrl()), urlFromClient(params.getToURL()),
                                 std::move(reply));
      },
      [](auto results, std::uint64_t capability, const NSErrorPtr& error) {
        results.setCapability(capability);
        codec::setError(results, error);
      });
}

kj::Promise<void> FilesObject::coordinateDeletion(CoordinateDeletionContext context) {
  return answerURL(context, [&](auto reply) {
    files().coordinateDeletion(itemURLFromClient(context.getParams()), std::move(reply));
  });
}

kj::Promise<void> FilesObject::physicalURL(PhysicalURLContext context) {
  return answer(
      _service, context,
      [&](auto reply) {
        files().physicalURL(urlFromClient(context.getParams().getUrl()), std::move(reply));
      },
      [](auto results, const NSURLPtr& url, bool isMarker, const NSErrorPtr& error) {
        encodeURL(results, url, error);
        results.setIsMarker(isMarker);
      });
}

kj::Promise<void> FilesObject::setTagNames(SetTagNamesContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        files().setTagNames(itemURLFromClient(params), codec::decode(params.getNames()),
                            std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> FilesObject::setLastOpenDate(SetLastOpenDateContext context) {
  const auto params = context.getParams();
  std::optional<NSDate> date;
  if (params.getHasDate()) date = codec::date(params.getDate());
  return answer(
      _service, context,
      [&](auto reply) {
        files().setLastOpenDate(itemURLFromClient(params), date, std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> FilesObject::setFavoriteRank(SetFavoriteRankContext context) {
  const auto params = context.getParams();
  std::optional<std::int64_t> rank;
  if (params.getHasRank()) rank = params.getRank();
  return answer(
      _service, context,
      [&](auto reply) {
        files().setFavoriteRank(itemURLFromClient(params), rank, std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> FilesObject::tagsInUse(TagsInUseContext context) {
  return answer(
      _service, context,
      [&](auto reply) {
        files().tagsInUse(codec::text(context.getParams().getAfter()), std::move(reply));
      },
      [](auto results, const std::vector<TagUse>& tags, const NSErrorPtr& error) {
        encodeList(results.initTags(static_cast<unsigned>(tags.size())), tags);
        codec::setError(results, error);
      });
}

kj::Promise<void> FilesObject::download(DownloadContext context) {
  const auto params = context.getParams();
  return startTransfer(context, [&](LocalFiles::URLReply reply) {
    return files().download(itemURLFromClient(params), params.getCurrentVersion(),
                            errorAlone(std::move(reply)));
  });
}

kj::Promise<void> FilesObject::evict(EvictContext context) {
  return answer(
      _service, context,
      [&](auto reply) { files().evict(itemURLFromClient(context.getParams()), std::move(reply)); },
      codec::encodeError);
}

kj::Promise<void> FilesObject::setPinned(SetPinnedContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        files().setPinned(itemURLFromClient(params), params.getPinned(), std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> FilesObject::trashedItems(TrashedItemsContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        files().trashedItems(params.getOffset(),
                             std::min(params.getLimit(), DaemonService::kLongestPage),
                             std::move(reply));
      },
      [](auto results, const std::vector<TrashedItem>& items, std::uint64_t nextOffset,
         const NSErrorPtr& error) {
        encodeList(results.initItems(static_cast<unsigned>(items.size())), items);
        results.setNextOffset(nextOffset);
        codec::setError(results, error);
      });
}

kj::Promise<void> FilesObject::history(HistoryContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        files().history(codec::text(params.getPath()), codec::text(params.getIdentifier()),
                        std::min(params.getLimit(), DaemonService::kLongestPage), std::move(reply));
      },
      [](auto results, const std::vector<FileHistoryEntry>& entries, const NSErrorPtr& error) {
        encodeList(results.initEntries(static_cast<unsigned>(entries.size())), entries);
        codec::setError(results, error);
      });
}

}  // namespace skein
