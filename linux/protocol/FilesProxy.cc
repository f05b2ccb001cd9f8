#include "linux/protocol/FilesProxy.h"

#include <utility>

#include "linux/protocol/DaemonCalls.h"
#include "linux/protocol/DocumentURL.h"
#include "linux/protocol/FilesCodec.h"
#include "linux/protocol/TransferProxy.h"

namespace skein {
namespace {

NSURLPtr urlOf(const auto& results) {
  return results.hasUrl() ? NSURL::fileURLWithPath(codec::text(results.getUrl())) : nullptr;
}

// The URL, and the item that was looked up there.
void setItemURL(auto& request, const NSURLPtr& url) {
  if (!url) return;
  request.setUrl(codec::bytes(url->path()));
  if (const auto item = fileObjectIDOfDocumentURL(url)) codec::encode(request.initItem(), *item);
}

// For an answer that is a URL or an error.
auto urlReply(LocalFiles::URLReply reply) {
  return [reply = std::move(reply)](const auto& results) mutable -> Task {
    return [reply = std::move(reply), url = urlOf(results),
            error = codec::errorOf(results)]() mutable { reply(std::move(url), std::move(error)); };
  };
}

// `url` as a place of the item that was asked about, where one was.
NSURLPtr ofItem(const std::optional<VLFileObjectID>& item, NSURLPtr url) {
  return url && item ? documentURL(url->path(), *item) : url;
}

// For an answer that is a list or an error.
template <class Value>
std::vector<Value> decodeAll(const auto& list) {
  std::vector<Value> values;
  values.reserve(list.size());
  for (const auto value : list) values.push_back(codec::decode(value));
  return values;
}

class FilesProxy final : public LocalFiles {
 public:
  explicit FilesProxy(DaemonCalls calls) : _calls(std::move(calls)) {}

  std::shared_ptr<NSProgress> importDocument(NSURLPtr source, NSURLPtr folder,
                                             std::optional<std::string> name, RequestOrigin origin,
                                             URLReply reply) override {
    return transfer(
        [=](wire::Files::Client& files) {
          auto request = files.importDocumentRequest();
          if (source) request.setSource(codec::bytes(source->path()));
          if (folder) request.setFolder(codec::bytes(folder->path()));
          if (name) request.setName(codec::bytes(*name));
          request.setOrigin(codec::bytes(origin));
          return request;
        },
        [reply = std::move(reply)](TransferOutcome outcome) mutable {
          reply(std::move(outcome.url), std::move(outcome.error));
        });
  }

  void createFolder(NSURLPtr folder, std::string name, RequestOrigin origin,
                    URLReply reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.createFolderRequest();
          if (folder) request.setFolder(codec::bytes(folder->path()));
          request.setName(codec::bytes(name));
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        urlReply(std::move(reply)));
  }

  void makeAlias(NSURLPtr folder, std::string name, std::string target, RequestOrigin origin,
                 URLReply reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.makeAliasRequest();
          if (folder) request.setFolder(codec::bytes(folder->path()));
          request.setName(codec::bytes(name));
          request.setTarget(codec::bytes(target));
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        urlReply(std::move(reply)));
  }

  void rename(NSURLPtr url, std::string newName, RequestOrigin origin, URLReply reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.renameRequest();
          setItemURL(request, url);
          request.setNewName(codec::bytes(newName));
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        urlReply(std::move(reply)));
  }

  std::shared_ptr<NSProgress> move(NSURLPtr url, NSURLPtr folder,
                                   std::optional<std::string> newName, bool bounce,
                                   RequestOrigin origin, URLReply reply) override {
    return transfer(
        [=](wire::Files::Client& files) {
          auto request = files.moveRequest();
          setItemURL(request, url);
          if (folder) request.setFolder(codec::bytes(folder->path()));
          if (newName) request.setNewName(codec::bytes(*newName));
          request.setBounce(bounce);
          request.setOrigin(codec::bytes(origin));
          return request;
        },
        [reply = std::move(reply)](TransferOutcome outcome) mutable {
          reply(std::move(outcome.url), std::move(outcome.error));
        });
  }

  std::shared_ptr<NSProgress> remove(NSURLPtr url, RequestOrigin origin,
                                     Reply<NSErrorPtr> reply) override {
    return transfer(
        [=](wire::Files::Client& files) {
          auto request = files.removeRequest();
          setItemURL(request, url);
          request.setOrigin(codec::bytes(origin));
          return request;
        },
        [reply = std::move(reply)](TransferOutcome outcome) mutable {
          reply(std::move(outcome.error));
        });
  }

  void trash(NSURLPtr url, RequestOrigin origin, URLReply reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.trashRequest();
          setItemURL(request, url);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        urlReply(std::move(reply)));
  }

  void putBackURL(NSURLPtr url, URLReply reply) override {
    ask(
        [=](wire::Files::Client& files) {
          auto request = files.putBackURLRequest();
          if (url) request.setUrl(codec::bytes(url->path()));
          return request.send();
        },
        urlReply(std::move(reply)));
  }

  void capabilityToMove(NSURLPtr url, NSURLPtr toURL,
                        Reply<std::uint64_t, NSErrorPtr> reply) override {
    ask(
        [=](wire::Files::Client& files) {
          auto request = files.capabilityToMoveRequest();
          if (url) request.setUrl(codec::bytes(url->path()));
          if (toURL) request.setToURL(codec::bytes(toURL->path()));
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return
              [reply = std::move(reply), capability = results.getCapability(),
               error = codec::errorOf(results)]() mutable { reply(capability, std::move(error)); };
        });
  }

  void coordinateDeletion(NSURLPtr url, URLReply reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.coordinateDeletionRequest();
          setItemURL(request, url);
          return request.send();
        },
        urlReply([item = fileObjectIDOfDocumentURL(url), reply = std::move(reply)](
                     NSURLPtr there, NSErrorPtr error) mutable {
          reply(ofItem(item, std::move(there)), std::move(error));
        }));
  }

  void physicalURL(NSURLPtr url, Reply<NSURLPtr, bool, NSErrorPtr> reply) override {
    ask(
        [=](wire::Files::Client& files) {
          auto request = files.physicalURLRequest();
          if (url) request.setUrl(codec::bytes(url->path()));
          return request.send();
        },
        [item = fileObjectIDOfDocumentURL(url),
         reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), physical = ofItem(item, urlOf(results)),
                  isMarker = results.getIsMarker(), error = codec::errorOf(results)]() mutable {
            reply(std::move(physical), isMarker, std::move(error));
          };
        });
  }

  void setTagNames(NSURLPtr url, std::vector<std::string> names, Reply<NSErrorPtr> reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.setTagNamesRequest();
          setItemURL(request, url);
          codec::encode(request.initNames(static_cast<unsigned>(names.size())), names);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void setLastOpenDate(NSURLPtr url, std::optional<NSDate> date, Reply<NSErrorPtr> reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.setLastOpenDateRequest();
          setItemURL(request, url);
          request.setHasDate(date.has_value());
          if (date) request.setDate(codec::moment(*date));
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void setFavoriteRank(NSURLPtr url, std::optional<std::int64_t> rank,
                       Reply<NSErrorPtr> reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.setFavoriteRankRequest();
          setItemURL(request, url);
          request.setHasRank(rank.has_value());
          if (rank) request.setRank(*rank);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) override {
    ask(
        [after = std::move(after)](wire::Files::Client& files) {
          auto request = files.tagsInUseRequest();
          request.setAfter(codec::bytes(after));
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), tags = decodeAll<TagUse>(results.getTags()),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(tags), std::move(error));
          };
        });
  }

  std::shared_ptr<NSProgress> download(NSURLPtr url, bool currentVersion,
                                       Reply<NSErrorPtr> reply) override {
    return transfer(
        [=](wire::Files::Client& files) {
          auto request = files.downloadRequest();
          setItemURL(request, url);
          request.setCurrentVersion(currentVersion);
          return request;
        },
        [reply = std::move(reply)](TransferOutcome outcome) mutable {
          reply(std::move(outcome.error));
        });
  }

  void evict(NSURLPtr url, Reply<NSErrorPtr> reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.evictRequest();
          setItemURL(request, url);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void setPinned(NSURLPtr url, bool pinned, Reply<NSErrorPtr> reply) override {
    change(
        [=](wire::Files::Client& files) {
          auto request = files.setPinnedRequest();
          setItemURL(request, url);
          request.setPinned(pinned);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void trashedItems(std::uint64_t offset, std::uint64_t limit,
                    Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) override {
    ask(
        [=](wire::Files::Client& files) {
          auto request = files.trashedItemsRequest();
          request.setOffset(offset);
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), items = decodeAll<TrashedItem>(results.getItems()),
                  next = results.getNextOffset(), error = codec::errorOf(results)]() mutable {
            reply(std::move(items), next, std::move(error));
          };
        });
  }

  void history(std::string path, std::string identifier, std::uint64_t limit,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override {
    ask(
        [=](wire::Files::Client& files) {
          auto request = files.historyRequest();
          request.setPath(codec::bytes(path));
          request.setIdentifier(codec::bytes(identifier));
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply),
                  entries = decodeAll<FileHistoryEntry>(results.getEntries()),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(entries), std::move(error));
          };
        });
  }

 private:
  // What only reads.
  template <class Build, class Decode>
  void ask(Build build, Decode decode) {
    _calls.call<wire::Files>(std::move(build), std::move(decode));
  }
  // What waits for the disk and for whoever uses the document.
  template <class Build, class Decode>
  void change(Build build, Decode decode) {
    _calls.call<wire::Files>(std::move(build), std::move(decode), Patience::WhilePeerLives);
  }
  template <class Build, class HandOn>
  std::shared_ptr<NSProgress> transfer(Build build, HandOn handOn) {
    auto proxy = std::make_shared<TransferProxy>(_calls.socket()->loop());
    auto progress = proxy->makeProgress();
    change(
        [build = std::move(build), proxy = std::move(proxy)](wire::Files::Client& files) {
          auto request = build(files);
          request.setObserver(proxy->observer());
          return proxy->outcomeOf(request.send());
        },
        [handOn = std::move(handOn)](TransferOutcome& outcome) mutable -> Task {
          return [handOn = std::move(handOn), outcome = std::move(outcome)]() mutable {
            handOn(std::move(outcome));
          };
        });
    return progress;
  }

  const DaemonCalls _calls;
};

}  // namespace

std::unique_ptr<LocalFiles> makeFilesProxy(DaemonCalls calls) {
  return std::make_unique<FilesProxy>(std::move(calls));
}

}  // namespace skein
