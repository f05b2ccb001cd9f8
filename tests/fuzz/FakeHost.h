// A host that answers everything with nothing, and whose streams never end.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "linux/protocol/HostService.h"
#include "linux/protocol/ServiceEndpoints.h"

namespace skein {

template <class T>
struct NothingOf {
  static T make() { return T{}; }
};
template <class... Values>
struct NothingOf<std::shared_ptr<HostStream<Values...>>> {
  struct Endless final : HostStream<Values...> {
    void next(Reply<Values..., NSErrorPtr> reply) override { reply(Values{}..., nullptr); }
  };
  static std::shared_ptr<HostStream<Values...>> make() { return std::make_shared<Endless>(); }
};
template <>
struct NothingOf<std::shared_ptr<HostTransfer>> {
  struct Endless final : HostTransfer {
    void next(Reply<HostTransferStep, NSErrorPtr> reply) override { reply({}, nullptr); }
    void cancel() override {}
  };
  static std::shared_ptr<HostTransfer> make() { return std::make_shared<Endless>(); }
};
template <>
struct NothingOf<std::shared_ptr<ServiceEndpoint>> {
  struct Closed final : ServiceEndpoint {
    void connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) override {
      reply(nullptr, connectionHasEndedError());
    }
  };
  static std::shared_ptr<ServiceEndpoint> make() { return std::make_shared<Closed>(); }
};

template <class... Values>
void answerNothing(UniqueFunction<void(Values...)>& reply) {
  reply(NothingOf<std::decay_t<Values>>::make()...);
}

class FakeHost final : public HostService,
                       public HostFiles,
                       public HostThumbnails,
                       public HostServices {
 public:
  template <class T>
  using To = Reply<T, NSErrorPtr>;
  using Done = Reply<NSErrorPtr>;
  using Origin = RequestOrigin;

  void list(HostTarget, HostOrder, To<std::shared_ptr<HostListing>> r) override {
    answerNothing(r);
  }
  void item(HostTarget, To<HostItem> r) override { answerNothing(r); }
  void identifierForPath(std::string, To<std::string> r) override { answerNothing(r); }
  void pathForIdentifier(std::string, To<std::string> r) override { answerNothing(r); }
  void watch(HostTarget, To<std::shared_ptr<HostWatch>> r) override { answerNothing(r); }
  void changesSince(std::optional<NSData>, To<HostChangeBatch> r) override { answerNothing(r); }
  void account(To<std::optional<LocalAccount>> r) override { answerNothing(r); }
  void logIn(LocalAccount, Done r) override { answerNothing(r); }
  void logOut(Done r) override { answerNothing(r); }
  void status(To<HostStatus> r) override { answerNothing(r); }
  void cloudStatus(To<LocalCloudStatus> r) override { answerNothing(r); }
  void setCloudConditions(LocalCloudConditions, Done r) override { answerNothing(r); }
  void setCloudKeeping(LocalCloudKeeping, Done r) override { answerNothing(r); }
  void collectCloud(To<LocalCloudCollection> r) override { answerNothing(r); }
  void check(bool, To<std::shared_ptr<HostCheck>> r) override { answerNothing(r); }
  void setDebugLog(bool, Done r) override { answerNothing(r); }
  HostFiles& files() override { return *this; }
  HostThumbnails& thumbnails() override { return *this; }

  void contents(HostTarget, bool, To<std::shared_ptr<HostTransfer>> r) override {
    answerNothing(r);
  }
  void evict(HostTarget, Done r) override { answerNothing(r); }
  void setPinned(HostTarget, bool, Done r) override { answerNothing(r); }
  void importDocument(std::string, HostTarget, Origin,
                      To<std::shared_ptr<HostTransfer>> r) override {
    answerNothing(r);
  }
  void createDirectory(std::string, HostTarget, Origin, ItemReply r) override { answerNothing(r); }
  void makeAlias(HostTarget, bool, std::string, HostTarget, Origin, ItemReply r) override {
    answerNothing(r);
  }
  void rename(HostTarget, std::string, Origin, ItemReply r) override { answerNothing(r); }
  void reparent(HostTarget, HostTarget, std::optional<std::string>, Origin,
                To<std::shared_ptr<HostTransfer>> r) override {
    answerNothing(r);
  }
  void trash(HostTarget, Origin, ItemReply r) override { answerNothing(r); }
  void untrash(HostTarget, std::optional<HostTarget>, Origin, ItemReply r) override {
    answerNothing(r);
  }
  void remove(HostTarget, Origin, To<std::shared_ptr<HostTransfer>> r) override {
    answerNothing(r);
  }
  void trashedItems(To<std::shared_ptr<HostTrash>> r) override { answerNothing(r); }
  void setTags(HostTarget, std::vector<std::string>, ItemReply r) override { answerNothing(r); }
  void tagsInUse(std::string, To<std::vector<TagUse>> r) override { answerNothing(r); }
  void setFavoriteRank(HostTarget, std::optional<std::int64_t>, ItemReply r) override {
    answerNothing(r);
  }
  void setLastUsedDate(HostTarget, std::optional<NSDate>, ItemReply r) override {
    answerNothing(r);
  }
  void defaultContainer(std::optional<std::string>, ItemReply r) override { answerNothing(r); }
  void history(HostTarget, std::uint64_t, To<std::vector<FileHistoryEntry>> r) override {
    answerNothing(r);
  }

  void fetchThumbnails(std::vector<HostTarget>, NSSize,
                       To<std::shared_ptr<HostThumbnailBatch>> r) override {
    answerNothing(r);
  }

  void serviceSources(HostTarget, To<std::vector<std::string>> r) override { answerNothing(r); }
  void endpoint(HostTarget, std::string, To<std::shared_ptr<ServiceEndpoint>> r) override {
    answerNothing(r);
  }
};

}  // namespace skein
