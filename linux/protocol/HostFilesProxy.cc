#include "linux/protocol/HostFilesProxy.h"

#include <string>
#include <utility>
#include <vector>

#include "linux/protocol/HostCalls.h"
#include "linux/protocol/HostFilesCodec.h"

namespace skein {
namespace {

using Wire = wire::HostFiles::Client;

struct DecodeStep {
  Task operator()(const auto& results, const SharedReply<HostTransferStep>& reply) {
    return [reply, step = codec::decode(results), error = codec::errorOf(results)]() mutable {
      (*reply)(std::move(step), std::move(error));
    };
  }
};

class HostTransferProxy final
    : public StreamProxy<HostTransfer, wire::HostTransfer::Client, DecodeStep, HostTransferStep> {
 public:
  using StreamProxy::StreamProxy;

  void cancel() override {
    _socket->loop()->post([client = _client] {
      // Where this does not arrive, the transfer has ended or ends with its connection.
      client->cancelRequest().send().detach([](kj::Exception&&) {});
    });
  }
};

Task decodePage(const auto& results, const SharedReply<std::vector<HostTrashedItem>, bool>& reply) {
  std::vector<HostTrashedItem> items;
  items.reserve(results.getItems().size());
  for (const auto item : results.getItems()) items.push_back(codec::decode(item));
  return [reply, items = std::move(items), last = results.getLast(),
          error = codec::errorOf(results)]() mutable {
    (*reply)(std::move(items), last, std::move(error));
  };
}

template <class Value>
std::vector<Value> decodeAll(const auto& list) {
  std::vector<Value> values;
  values.reserve(list.size());
  for (const auto value : list) values.push_back(codec::decode(value));
  return values;
}

class HostFilesProxy final : public HostFiles, private HostCalls<wire::HostFiles> {
 public:
  using HostCalls::HostCalls;

  void contents(HostTarget target, bool currentVersion,
                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override {
    callForTransfer(
        [target = std::move(target), currentVersion](Wire& host) {
          auto request = host.contentsRequest();
          codec::encode(request.initTarget(), target);
          request.setCurrentVersion(currentVersion);
          return request.send();
        },
        reply);
  }

  void evict(HostTarget target, Reply<NSErrorPtr> reply) override {
    callForError(
        [target = std::move(target)](Wire& host) {
          auto request = host.evictRequest();
          codec::encode(request.initTarget(), target);
          return request.send();
        },
        reply);
  }

  void setPinned(HostTarget target, bool pinned, Reply<NSErrorPtr> reply) override {
    callForError(
        [target = std::move(target), pinned](Wire& host) {
          auto request = host.setPinnedRequest();
          codec::encode(request.initTarget(), target);
          request.setPinned(pinned);
          return request.send();
        },
        reply);
  }

  void importDocument(std::string source, HostTarget parent, RequestOrigin origin,
                      Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override {
    callForTransfer(
        [source = std::move(source), parent = std::move(parent),
         origin = std::move(origin)](Wire& host) {
          auto request = host.importDocumentRequest();
          request.setSource(codec::bytes(source));
          codec::encode(request.initParent(), parent);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void createDirectory(std::string name, HostTarget parent, RequestOrigin origin,
                       ItemReply reply) override {
    callForItem(
        [name = std::move(name), parent = std::move(parent),
         origin = std::move(origin)](Wire& host) {
          auto request = host.createDirectoryRequest();
          request.setName(codec::bytes(name));
          codec::encode(request.initParent(), parent);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void makeAlias(HostTarget target, bool outside, std::string name, HostTarget parent,
                 RequestOrigin origin, ItemReply reply) override {
    callForItem(
        [target = std::move(target), outside, name = std::move(name), parent = std::move(parent),
         origin = std::move(origin)](Wire& host) {
          auto request = host.makeAliasRequest();
          codec::encode(request.initTarget(), target);
          request.setOutside(outside);
          request.setName(codec::bytes(name));
          codec::encode(request.initParent(), parent);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void rename(HostTarget target, std::string newName, RequestOrigin origin,
              ItemReply reply) override {
    callForItem(
        [target = std::move(target), name = std::move(newName),
         origin = std::move(origin)](Wire& host) {
          auto request = host.renameRequest();
          codec::encode(request.initTarget(), target);
          request.setNewName(codec::bytes(name));
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void reparent(HostTarget target, HostTarget parent, std::optional<std::string> newName,
                RequestOrigin origin,
                Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override {
    callForTransfer(
        [target = std::move(target), parent = std::move(parent), name = std::move(newName),
         origin = std::move(origin)](Wire& host) {
          auto request = host.reparentRequest();
          codec::encode(request.initTarget(), target);
          codec::encode(request.initParent(), parent);
          if (name) request.setNewName(codec::bytes(*name));
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void trash(HostTarget target, RequestOrigin origin, ItemReply reply) override {
    callForItem(
        [target = std::move(target), origin = std::move(origin)](Wire& host) {
          auto request = host.trashRequest();
          codec::encode(request.initTarget(), target);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void untrash(HostTarget target, std::optional<HostTarget> parent, RequestOrigin origin,
               ItemReply reply) override {
    callForItem(
        [target = std::move(target), parent = std::move(parent),
         origin = std::move(origin)](Wire& host) {
          auto request = host.untrashRequest();
          codec::encode(request.initTarget(), target);
          if (parent) codec::encode(request.initParent(), *parent);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void remove(HostTarget target, RequestOrigin origin,
              Reply<std::shared_ptr<HostTransfer>, NSErrorPtr> reply) override {
    callForTransfer(
        [target = std::move(target), origin = std::move(origin)](Wire& host) {
          auto request = host.removeRequest();
          codec::encode(request.initTarget(), target);
          request.setOrigin(codec::bytes(origin));
          return request.send();
        },
        reply);
  }

  void trashedItems(Reply<std::shared_ptr<HostTrash>, NSErrorPtr> reply) override {
    call<std::shared_ptr<HostTrash>>(
        [](Wire& host) { return host.trashedItemsRequest().send(); },
        [socket = _socket](auto& results) -> std::shared_ptr<HostTrash> {
          if (!results.hasTrash()) return nullptr;
          return makeStream<std::vector<HostTrashedItem>, bool>(
              socket, results.getTrash(),
              [](const auto& page, const auto& next) { return decodePage(page, next); });
        },
        reply);
  }

  void setTags(HostTarget target, std::vector<std::string> names, ItemReply reply) override {
    callForItem(
        [target = std::move(target), names = std::move(names)](Wire& host) {
          auto request = host.setTagsRequest();
          codec::encode(request.initTarget(), target);
          codec::encode(request.initNames(static_cast<unsigned>(names.size())), names);
          return request.send();
        },
        reply);
  }

  void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) override {
    call<std::vector<TagUse>>(
        [after = std::move(after)](Wire& host) {
          auto request = host.tagsInUseRequest();
          request.setAfter(codec::bytes(after));
          return request.send();
        },
        [](auto& results) { return decodeAll<TagUse>(results.getTags()); }, reply);
  }

  void setFavoriteRank(HostTarget target, std::optional<std::int64_t> rank,
                       ItemReply reply) override {
    callForItem(
        [target = std::move(target), rank](Wire& host) {
          auto request = host.setFavoriteRankRequest();
          codec::encode(request.initTarget(), target);
          request.setHasRank(rank.has_value());
          request.setRank(rank.value_or(0));
          return request.send();
        },
        reply);
  }

  void setLastUsedDate(HostTarget target, std::optional<NSDate> date, ItemReply reply) override {
    callForItem(
        [target = std::move(target), date](Wire& host) {
          auto request = host.setLastUsedDateRequest();
          codec::encode(request.initTarget(), target);
          request.setHasDate(date.has_value());
          if (date) request.setDate(codec::moment(*date));
          return request.send();
        },
        reply);
  }

  void defaultContainer(std::optional<std::string> bundleIdentifier, ItemReply reply) override {
    callForItem(
        [bundle = std::move(bundleIdentifier)](Wire& host) {
          auto request = host.defaultContainerRequest();
          if (bundle) request.setBundleIdentifier(codec::bytes(*bundle));
          return request.send();
        },
        reply);
  }

  void history(HostTarget target, std::uint64_t limit,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override {
    call<std::vector<FileHistoryEntry>>(
        [target = std::move(target), limit](Wire& host) {
          auto request = host.historyRequest();
          codec::encode(request.initTarget(), target);
          request.setLimit(limit);
          return request.send();
        },
        [](auto& results) { return decodeAll<FileHistoryEntry>(results.getEntries()); }, reply);
  }

 private:
  template <class Send>
  void callForItem(Send send, ItemReply& reply) {
    call<HostItem>(
        std::move(send), [](auto& results) { return codec::decode(results.getItem()); }, reply);
  }

  template <class Send>
  void callForTransfer(Send send, Reply<std::shared_ptr<HostTransfer>, NSErrorPtr>& reply) {
    call<std::shared_ptr<HostTransfer>>(
        std::move(send),
        [socket = _socket](auto& results) -> std::shared_ptr<HostTransfer> {
          if (!results.hasTransfer()) return nullptr;
          return std::make_shared<HostTransferProxy>(socket, results.getTransfer());
        },
        reply);
  }
};

}  // namespace

std::unique_ptr<HostFiles> makeHostFilesProxy(std::shared_ptr<SocketClient> socket) {
  return std::make_unique<HostFilesProxy>(std::move(socket));
}

}  // namespace skein
