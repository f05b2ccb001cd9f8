// Watches and subscriptions: references both ways, and how they end.
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

VLQueryItemPtr document(std::uint64_t number) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = VLFileObjectID::documentWithRawID(number);
  properties.itemIdentifier = properties.fileObjectID.asString();
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

// Notes pushes and keeps their replies until the test gives them.
class Receiver final : public VLItemNotificationReceiving {
 public:
  struct Push {
    VLQueryItems items;
    std::vector<std::string> logical;
    std::vector<std::string> physical;
    Reply<> reply;
  };
  explicit Receiver(std::shared_ptr<Inbox<int>> gone) : _gone(std::move(gone)) {}
  ~Receiver() override { _gone->add(1); }

  void receiveUpdates(const VLQueryItems& items, const std::vector<std::string>& logicalExtensions,
                      const std::vector<std::string>& physicalExtensions, Reply<> reply) override {
    pushes.add({items, logicalExtensions, physicalExtensions, std::move(reply)});
  }
  void receiveProgressUpdates(const VLQueryItems& updates, Reply<>) override {
    progress.add(updates.size());
  }

  Inbox<Push> pushes;
  Inbox<std::size_t> progress;

 private:
  const std::shared_ptr<Inbox<int>> _gone;
};

class Links : public ProtocolTest {
 protected:
  // Sets a watch up and takes both its ends.
  void link() {
    auto [got, dictionary, error] =
        ask<std::shared_ptr<VLItemNotificationSender>, VLDaemon::Dictionary, NSErrorPtr>(
            *client, [&](LocalDaemon& proxy, auto reply) {
              proxy.getItemUpdateSenderWithReceiver(receiver, std::move(reply));
            });
    ASSERT_TRUE(got);
    sender = std::move(got);
    served = *daemon->senders.take();
  }
  void push(std::uint64_t number) {
    served->receiver->receiveUpdates({document(number)}, {"l\xff"}, {}, [this] { acks.add(1); });
  }

  std::shared_ptr<Inbox<int>> receiversGone = std::make_shared<Inbox<int>>();
  std::shared_ptr<Receiver> receiver = std::make_shared<Receiver>(receiversGone);
  std::shared_ptr<VLItemNotificationSender> sender;
  std::shared_ptr<FakeSender> served;
  Inbox<int> acks;
};

TEST_F(Links, PushesArriveInOrderAndTheirRepliesGoBack) {
  link();
  for (std::uint64_t number = 1; number <= 20; ++number) push(number);
  served->receiver->receiveProgressUpdates({document(1), document(2)},
                                           [] { ADD_FAILURE() << "nobody waits for this"; });
  for (std::uint64_t number = 1; number <= 20; ++number) {
    auto push = receiver->pushes.take();
    ASSERT_TRUE(push);
    EXPECT_EQ(push->items.front()->properties(), document(number)->properties());
    EXPECT_EQ(push->logical, std::vector<std::string>{"l\xff"});
    EXPECT_TRUE(push->physical.empty());
    EXPECT_EQ(acks.count(), 0U) << "vald hears of a push when the receiver replied";
    push->reply();
    acks.take();
  }
  EXPECT_EQ(receiver->progress.take(), 2U);
}

// What vald pushes may be too large for a message. vald hears that it did not arrive, and the
// link is as good as before.
TEST_F(Links, APushThatCannotBeSentFailsAlone) {
  link();
  VLQueryItem::Properties large = document(1)->properties();
  large.tagData = NSData(std::string(20 << 20, 't'));
  const VLQueryItems items(4, std::make_shared<const VLQueryItem>(large));
  auto kept = std::make_shared<int>(0);
  std::weak_ptr<int> reply = kept;
  served->receiver->receiveUpdates(items, {}, {}, [this, kept = std::move(kept)] { acks.add(1); });
  EXPECT_TRUE(becomesTrue([&] { return reply.expired(); })) << "the reply goes uncalled";
  EXPECT_EQ(acks.count(), 0U);

  served->receiver->receiveProgressUpdates(items, [] {});
  for (int more = 0; more < 20; ++more) {
    served->receiver->receiveProgressUpdates({document(1)}, [] {});
    EXPECT_EQ(receiver->progress.take(), 1U);
  }
  push(2);
  const auto push = receiver->pushes.take();
  ASSERT_TRUE(push);
  EXPECT_EQ(push->items.front()->fileObjectID(), document(2)->fileObjectID());
}

TEST_F(Links, MessagesOfTheSenderReachVald) {
  link();
  Outcome<> boosted;
  Outcome<NSErrorPtr> watched;
  sender->remoteObjectProxyWithErrorHandler(boosted.errorHandler())->boostPriority(boosted.reply());
  const auto watching = sender->remoteObjectProxyWithErrorHandler(watched.errorHandler());
  watching->watchItemAtURL(NSURL::fileURLWithPath("/s/\xff"), 23, watched.reply());
  (*served->boosts.take())();
  boosted.value();
  auto watch = served->watches.take();
  EXPECT_EQ(watch->path, "/s/\xff");
  EXPECT_EQ(watch->options, 23U);
  EXPECT_EQ(watch->item, std::nullopt);
  const auto folder = VLFileObjectID::folderOrAliasWithRawID(7);
  Outcome<NSErrorPtr> again;
  watching->watchItemAtURL(documentURL("/s/d", folder), 19, again.reply());
  auto known = served->watches.take();
  EXPECT_EQ(known->item, folder);
  known->reply(nullptr);
  EXPECT_FALSE(std::get<0>(again.value()));
  watch->reply(NSError::errorWithDomain(NSPOSIXErrorDomain, 2));
  EXPECT_EQ(std::get<0>(watched.value())->code(), 2);

  // After invalidate() nothing is delivered and the receiver is let go.
  watching->invalidate();
  EXPECT_TRUE(served->invalidations.waitForCount(1));
  receiver.reset();
  EXPECT_TRUE(receiversGone->waitForCount(1));
}

// A vald that is busy for longer than a message's deadline: boosting is no question whose
// answer anybody waits for, and the link is as good as before.
TEST_F(Links, ABoostThatIsAnsweredLateBreaksNothing) {
  client = newClient(std::chrono::milliseconds(700));
  link();
  Outcome<> boosted;
  const auto proxy = sender->remoteObjectProxyWithErrorHandler(boosted.errorHandler());
  proxy->boostPriority(boosted.reply());
  auto boost = served->boosts.take();
  ASSERT_TRUE(boost);
  daemon->holds = true;
  Outcome<NSFileProviderItems, std::uint64_t, NSErrorPtr> late;
  client->remoteObjectProxyWithErrorHandler(late.errorHandler())
      ->enumerateItemsInFolder(std::nullopt, 0, 0, 1, late.reply());
  EXPECT_TRUE(late.errors->waitForCount(1)) << "sent later, so the boost is late as well";
  (*boost)();
  boosted.value();
  push(1);
  EXPECT_TRUE(receiver->pushes.waitForCount(1));
}

TEST_F(Links, ValdsRefusalComesAsAnError) {
  daemon->error = NSError::errorWithDomain(VLVellumErrorDomain, 2);
  const auto [got, dictionary, error] =
      ask<std::shared_ptr<VLItemNotificationSender>, VLDaemon::Dictionary, NSErrorPtr>(
          *client, [&](LocalDaemon& proxy, auto reply) {
            proxy.getItemUpdateSenderWithReceiver(receiver, std::move(reply));
          });
  EXPECT_EQ(got, nullptr);
  EXPECT_EQ(error->code(), 2);
  receiver.reset();
  EXPECT_TRUE(receiversGone->waitForCount(1));
}

TEST_F(Links, LastHandleLetsGoOfValdsObject) {
  link();
  auto proxy = sender->remoteObjectProxyWithErrorHandler(nullptr);
  sender.reset();
  EXPECT_EQ(served->invalidations.count(), 0U) << "a proxy holds it too";
  proxy.reset();
  EXPECT_TRUE(served->invalidations.waitForCount(1));
  served.reset();
  EXPECT_TRUE(daemon->sendersGone->waitForCount(1));
  receiver.reset();
  EXPECT_TRUE(receiversGone->waitForCount(1));
}

TEST_F(Links, ClientThatDiesLetsGoOfItsSenders) {
  link();
  client.reset();
  EXPECT_TRUE(served->invalidations.waitForCount(1));
  served.reset();
  EXPECT_TRUE(daemon->sendersGone->waitForCount(1));
}

TEST_F(Links, BrokenLinkReachesEveryProxyOnce) {
  link();
  Outcome<> first;
  Outcome<> second;
  Outcome<> dropped;
  const auto a = sender->remoteObjectProxyWithErrorHandler(first.errorHandler());
  const auto b = sender->remoteObjectProxyWithErrorHandler(second.errorHandler());
  sender->remoteObjectProxyWithErrorHandler(dropped.errorHandler());
  (*served->linkBrokenHandlers.take())(NSError::errorWithDomain(VLVellumErrorDomain, 99));
  EXPECT_EQ((*first.errors->take())->code(), 99);
  EXPECT_EQ((*second.errors->take())->code(), 99);

  // A proxy made later hears of it at once; the lost connection is no more news.
  Outcome<> late;
  const auto c = sender->remoteObjectProxyWithErrorHandler(late.errorHandler());
  EXPECT_EQ((*late.errors->take())->code(), 99);
  receiver.reset();
  EXPECT_TRUE(receiversGone->waitForCount(1));
  server->dropConnections();
  Outcome<> afterwards;
  sender->remoteObjectProxyWithErrorHandler(afterwards.errorHandler())
      ->boostPriority(afterwards.reply());
  EXPECT_TRUE(afterwards.errors->waitForCount(1));
  EXPECT_EQ(first.errors->count() + second.errors->count() + dropped.errors->count(), 0U);
}

TEST_F(Links, LostConnectionReachesEveryProxyOnce) {
  link();
  Outcome<NSErrorPtr> waiting;  // two messages under way
  Outcome<> idle;               // none
  const auto a = sender->remoteObjectProxyWithErrorHandler(waiting.errorHandler());
  const auto b = sender->remoteObjectProxyWithErrorHandler(idle.errorHandler());
  a->watchItemAtURL(NSURL::fileURLWithPath("/s"), 19, waiting.reply());
  a->watchItemAtURL(NSURL::fileURLWithPath("/s"), 19, waiting.reply());
  ASSERT_TRUE(served->watches.waitForCount(2));
  server->dropConnections();
  ASSERT_TRUE(waiting.errors->waitForCount(2));
  ASSERT_TRUE(idle.errors->waitForCount(1));
  unreachable(*idle.errors->take());

  // A message sent afterwards fails with the same error; a new link works.
  b->boostPriority(idle.reply());
  unreachable(*idle.errors->take());
  // vald's object goes when vald has answered what it was asked.
  (*served->watches.take()).reply(nullptr);
  (*served->watches.take()).reply(nullptr);
  EXPECT_TRUE(served->invalidations.waitForCount(1));
  const auto old = std::move(sender);
  link();
  push(5);
  EXPECT_TRUE(receiver->pushes.waitForCount(1));
  EXPECT_EQ(waiting.errors->count(), 2U) << "one for each message and none for the loss";
  EXPECT_EQ(idle.errors->count(), 0U);
}

class Events final : public LocalDaemonEvents {
 public:
  void accountDidChange(std::optional<LocalAccount> account) override {
    accounts.add(std::move(account));
  }
  void containerListDidChange() override { containers.add(1); }
  Inbox<std::optional<LocalAccount>> accounts;
  Inbox<int> containers;
};

TEST_F(Links, SubscribersHearOfEventsUntilTheirClientIsGone) {
  auto events = std::make_shared<Events>();
  ask<NSErrorPtr>(
      *client, [&](LocalDaemon& proxy, auto reply) { proxy.subscribe(events, std::move(reply)); });
  const auto subscriber = *daemon->subscribers.take();
  ASSERT_TRUE(subscriber.lock()) << "the server holds it, not vald";
  subscriber.lock()->accountDidChange(LocalAccount{"a", std::nullopt});
  EXPECT_EQ(events->accounts.take()->value(), (LocalAccount{"a", std::nullopt}));
  subscriber.lock()->accountDidChange(std::nullopt);
  EXPECT_EQ(events->accounts.take().value(), std::nullopt);
  subscriber.lock()->containerListDidChange();
  EXPECT_TRUE(events->containers.waitForCount(1));

  // The client's side holds the subscriber weakly.
  std::weak_ptr<Events> weak = events;
  events.reset();
  EXPECT_TRUE(becomesTrue([&] { return weak.expired(); })) << "once no delivery is under way";

  client.reset();
  EXPECT_TRUE(becomesTrue([&] { return subscriber.expired(); }));
}

}  // namespace
}  // namespace skein
