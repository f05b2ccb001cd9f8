// What is asked about documents: in whose name, how transfers are followed and given up, and
// what becomes of answers that say nothing.
#include <cerrno>
#include <map>

#include "linux/framework/EvictionOutcome.h"
#include "linux/framework/RequestOrigin.h"
#include "linux/framework/RequestProgress.h"
#include "linux/host/HostFileRequests.h"
#include "platform/fileprovider/FPTags.h"
#include "tests/host/HostFixture.h"
#include "tests/protocol/FakeDaemon.h"

namespace skein {
namespace {

constexpr std::chrono::milliseconds kStep{100};

// An item in the root that bears its name as its identifier.
NSFileProviderItemPtr inRoot(const std::string& name) {
  VLQueryItem::Properties properties;
  properties.itemIdentifier = properties.filename = name;
  properties.parentItemIdentifier = NSFileProviderRootContainerItemIdentifier;
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

// Notes what it is asked, with the origin, and holds transfers. Items are found by URL too:
// "/drive/NAME" is the item NAME.
class FileExtension final : public NSFileProviderExtension {
 public:
  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override {
    if (identifier == NSFileProviderRootContainerItemIdentifier) {
      return NSURL::fileURLWithPath("/drive");
    }
    const auto at = items.find(identifier);
    return at != items.end() ? NSURL::fileURLWithPath("/drive/" + at->second->filename()) : nullptr;
  }
  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) override {
    for (const auto& [identifier, found] : items) {
      if (url->path() == "/drive/" + found->filename()) return identifier;
    }
    return std::nullopt;
  }
  NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                          NSErrorOut out) override {
    const auto at = items.find(identifier);
    if (at != items.end()) return at->second;
    out.store(fileProviderErrorForNonExistentItemWithIdentifier(identifier));
    return nullptr;
  }
  void startProvidingItemAtURL(const NSURLPtr& url, std::uint64_t options,
                               ErrorCompletion done) override {
    note("start " + url->path() + (options != 0 ? " current" : ""));
    transfers.push_back({RequestProgressScope::current(), std::move(done), nullptr});
  }
  void stopProvidingItemAtURL(const NSURLPtr& url) override {
    note("stop " + url->path());
    if (whileStopping) whileStopping();
  }
  void importDocumentAtURL(const NSURLPtr& url, const NSFileProviderItemIdentifier& parent,
                           ItemCompletion done) override {
    note("import " + url->path() + " to " + parent);
    transfers.push_back({RequestProgressScope::current(), nullptr, std::move(done)});
  }
  void createDirectoryWithName(const std::string& name, const NSFileProviderItemIdentifier& parent,
                               ItemCompletion done) override {
    answer("mkdir " + name + " in " + parent, done);
  }
  void renameItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                const std::string& name, ItemCompletion done) override {
    answer("rename " + identifier + " to " + name, done);
  }
  void reparentItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                  const NSFileProviderItemIdentifier& parent,
                                  std::optional<std::string> name, ItemCompletion done) override {
    answer("move " + identifier + " to " + parent + " as " + name.value_or("nil"), done);
  }
  void trashItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                               ItemCompletion done) override {
    answer("trash " + identifier, done);
  }
  void untrashItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                 std::optional<NSFileProviderItemIdentifier> parent,
                                 ItemCompletion done) override {
    answer("untrash " + identifier + " to " + parent.value_or("nil"), done);
  }
  void deleteItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                ErrorCompletion done) override {
    note("delete " + identifier);
    transfers.push_back({RequestProgressScope::current(), std::move(done), nullptr});
  }
  void setTagData(std::optional<NSData> data, const NSFileProviderItemIdentifier& identifier,
                  ItemCompletion done) override {
    std::string names;
    for (const FPTag& tag : FPGetTagsFromTagsData(data)) names += ' ' + tag.label;
    answer("tag " + identifier + names, done);
  }
  void _defaultApplicationContainerForBundleIdentifier(std::optional<std::string> bundle,
                                                       ItemCompletion done) override {
    answer("default " + bundle.value_or("nil"), done);
  }

  struct Transfer {
    std::shared_ptr<RequestProgress> progress;
    ErrorCompletion provided;
    ItemCompletion imported;
  };
  std::map<std::string, NSFileProviderItemPtr> items;
  std::pair<NSFileProviderItemPtr, NSErrorPtr> answered;
  std::vector<std::string> calls;
  std::deque<Transfer> transfers;
  std::function<void()> whileStopping;

 private:
  void note(std::string call) {
    const RequestOrigin origin = RequestOriginScope::current();
    calls.push_back(std::move(call) + (origin.empty() ? "" : " by " + origin));
  }
  void answer(std::string call, ItemCompletion& done) {
    note(std::move(call));
    done(answered.first, answered.second);
  }
};

class NoContainers final : public VLContainers {
 public:
  VLContainersByID allContainersByContainerID() override { return {}; }
  VLContainersByID allContainers() override { return {}; }
};

class FileRequests : public testing::Test {
 protected:
  using Words = std::vector<std::string>;
  using TransferReply = Reply<std::shared_ptr<HostTransfer>, NSErrorPtr>;

  FileRequests() {
    host->setExtension(extension);
    extension->items["a"] = inRoot("a");
    extension->items["b"] = inRoot("b");
    extension->answered.first = extension->items["a"];
    drive = std::make_shared<DriveRequests>(
        host, [this](auto) { return daemon; }, containers);
    files = std::make_unique<HostFileRequests>(drive);
  }
  ~FileRequests() override {
    for (auto& held : extension->transfers) {
      held.provided.neverAnswered();
      held.imported.neverAnswered();
    }
    pass();  // what is still timed holds the timers
  }

  void run() { executor->runAll(); }
  Words calls() {
    run();
    return std::exchange(extension->calls, {});
  }
  HostFiles::ItemReply itemReply() {
    return [this](const HostItem& found, const NSErrorPtr& problem) {
      heard.push_back(found.item ? found.item->filename() + " at " + found.path : textOf(problem));
    };
  }
  Reply<NSErrorPtr> errorReply() {
    return [this](const NSErrorPtr& problem) { heard.push_back(textOf(problem)); };
  }
  TransferReply transferReply(std::shared_ptr<HostTransfer>& stream) {
    return [this, &stream](std::shared_ptr<HostTransfer> made, const NSErrorPtr& problem) {
      stream = std::move(made);
      if (problem) heard.push_back(textOf(problem));
    };
  }
  // Follows the transfer to its end.
  TransferReply endReply() {
    return [this](std::shared_ptr<HostTransfer> made, const NSErrorPtr& problem) {
      if (!made) return itemReply()({}, problem);
      made->next([this, made](const HostTransferStep& step, const NSErrorPtr& error) {
        itemReply()(step.item, error);
      });
    };
  }
  std::shared_ptr<HostTransfer> startImport() {
    std::shared_ptr<HostTransfer> stream;
    files->importDocument("/home/new", HostTarget::path("/"), "me", transferReply(stream));
    run();
    return stream;
  }
  std::shared_ptr<HostTransfer> get(const char* identifier, bool current = false) {
    std::shared_ptr<HostTransfer> stream;
    files->contents(HostTarget::identifier(identifier), current, transferReply(stream));
    run();
    return stream;
  }
  void next(HostTransfer& stream) {
    stream.next([this](const HostTransferStep& step, const NSErrorPtr& problem) {
      const auto& item = step.item.item;
      heard.push_back(problem         ? textOf(problem)
                      : step.finished ? "finished " + (item ? item->filename() : "without item")
                                      : std::to_string(step.completedBytes) + " of " +
                                            std::to_string(step.totalBytes));
    });
    run();
  }
  void pass() {
    timers->advance(kStep);
    run();
  }
  FileExtension::Transfer take() {
    auto taken = std::move(extension->transfers.front());
    extension->transfers.pop_front();
    return taken;
  }
  static std::string textOf(const NSErrorPtr& error) {
    return error ? "error " + std::to_string(error->code()) : "done";
  }
  static NSErrorPtr cancelled() {
    return NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError);
  }

  const std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  const std::shared_ptr<ManualTimers> timers = std::make_shared<ManualTimers>(executor);
  NoLog log;
  NoContainers containers;
  const std::shared_ptr<FakeDaemon> daemon = std::make_shared<FakeDaemon>();
  const std::shared_ptr<FileExtension> extension = std::make_shared<FileExtension>();
  const std::shared_ptr<FileProviderHost> host =
      std::make_shared<FileProviderHost>(HostTools{executor, timers}, nullptr, log);
  std::shared_ptr<DriveRequests> drive;
  std::unique_ptr<HostFiles> files;
  Words heard;
};

TEST_F(FileRequests, EachChangeIsTheExtensionsInItsOriginsName) {
  const HostTarget a = HostTarget::path("/a");
  const HostTarget b = HostTarget::identifier("b");
  files->createDirectory("new", HostTarget::path("/"), "me", itemReply());
  files->rename(a, "c", "me", itemReply());
  files->reparent(a, b, std::nullopt, "me", endReply());
  files->reparent(a, b, "c", "me", endReply());
  files->trash(a, "me", itemReply());
  files->untrash(b, std::nullopt, "me", itemReply());
  files->untrash(b, a, "me", itemReply());
  files->setTags(a, {"x", "y"}, itemReply());
  EXPECT_EQ(calls(), (Words{"mkdir new in NSFileProviderRootContainerItemIdentifier by me",
                            "rename a to c by me", "move a to b as nil by me",
                            "move a to b as c by me", "trash a by me", "untrash b to nil by me",
                            "untrash b to a by me", "tag a x y"}));
  EXPECT_EQ(heard, (Words{"a at /a", "a at /a", "a at /a", "a at /a", "a at /a", "a at /a",
                          "a at /a", "a at /a"}));
  EXPECT_EQ(RequestOriginScope::current(), "");
}

TEST_F(FileRequests, AnItemCountsWhateverErrorIsBesideItAndNothingIsAnError) {
  const HostTarget a = HostTarget::path("/a");
  extension->answered.second = cancelled();
  files->reparent(a, a, std::nullopt, "", endReply());
  run();
  extension->answered = {};
  files->trash(a, "", itemReply());
  files->trash(HostTarget::path("/gone"), "", itemReply());
  // A name with no tag in it never reaches the extension.
  files->setTags(a, {""}, itemReply());
  run();
  EXPECT_EQ(heard, (Words{"a at /a", "error 512", "error -1005", "error 15"}));
  EXPECT_EQ(calls(), (Words{"move a to a as nil", "trash a"}));

  // The Documents folder that is there already is what was asked for.
  heard.clear();
  extension->answered.second = fileProviderErrorForCollisionWithItem(extension->items["b"]);
  files->defaultContainer(std::nullopt, itemReply());
  run();
  EXPECT_EQ(heard, (Words{"b at /b"}));
}

TEST_F(FileRequests, AnImportTellsHowFarItIsAndWhatItMade) {
  const auto stream = startImport();
  EXPECT_EQ(calls(),
            (Words{"import /home/new to NSFileProviderRootContainerItemIdentifier by me"}));
  auto held = take();
  const auto progress = NSProgress::progressWithTotalUnitCount(10);
  held.progress->follow(progress);
  next(*stream);
  pass();
  next(*stream);
  pass();  // nothing new
  EXPECT_EQ(heard, (Words{"0 of 10"}));
  progress->setCompletedUnitCount(4);
  pass();
  EXPECT_EQ(heard, (Words{"0 of 10", "4 of 10"}));
  next(*stream);
  next(*stream);
  held.imported(extension->items["a"], nullptr);
  run();
  EXPECT_EQ(heard, (Words{"0 of 10", "4 of 10", "finished a", "finished a"}));

  // Neither item nor error: the host looks, and says so when there is nothing to see.
  for (const bool isThere : {true, false}) {
    heard.clear();
    const auto silent = startImport();
    if (isThere) {
      extension->items["new"] = inRoot("new");
    } else {
      extension->items.erase("new");
    }
    take().imported(nullptr, nullptr);
    next(*silent);
    EXPECT_EQ(heard, (Words{isThere ? "finished new" : "error 512"}));
  }
}

TEST_F(FileRequests, LettingGoOfAnImportCancelsItNowOrWhenItBegins) {
  for (const bool hasBegun : {true, false}) {
    auto stream = startImport();
    auto held = take();
    const auto progress = NSProgress::progressWithTotalUnitCount(10);
    if (hasBegun) held.progress->follow(progress);
    EXPECT_FALSE(progress->isCancelled());
    stream = nullptr;
    if (!hasBegun) held.progress->follow(progress);
    EXPECT_TRUE(progress->isCancelled());
    held.imported(nullptr, cancelled());
    run();
  }
  EXPECT_EQ(heard, Words());
}

TEST_F(FileRequests, ARemovalIsCancelledByAskingOrByLettingGoAndSaysWhatBecameOfIt) {
  for (const bool isAsked : {true, false}) {
    std::shared_ptr<HostTransfer> stream;
    files->remove(HostTarget::path("/a"), "me", transferReply(stream));
    EXPECT_EQ(calls(), (Words{"delete a by me"}));
    auto held = take();
    const auto removal = NSProgress::progressWithTotalUnitCount(0);
    held.progress->follow(removal);
    next(*stream);
    EXPECT_FALSE(removal->isCancelled());
    if (isAsked) {
      stream->cancel();
    } else {
      stream = nullptr;
    }
    EXPECT_TRUE(removal->isCancelled());
    EXPECT_EQ(heard, Words());
    // It came too late, or in time.
    held.provided(isAsked ? nullptr : cancelled());
    run();
    EXPECT_EQ(std::exchange(heard, {}), (Words{isAsked ? "finished without item" : "error 3072"}));
  }
}

TEST_F(FileRequests, WhoCancelsADownloadIsAnsweredThoughOthersStillWantIt) {
  const auto first = get("a");
  const auto second = get("a");
  auto held = take();
  held.progress->follow(NSProgress::progressWithTotalUnitCount(10));
  next(*first);
  next(*second);
  first->cancel();
  run();
  EXPECT_EQ(heard, (Words{"error 3072"}));
  held.provided(nullptr);
  run();
  EXPECT_EQ(heard, (Words{"error 3072", "finished a"}));
}

TEST_F(FileRequests, AFileThatSeveralWantIsAskedForOnceAndCancelledWithTheLast) {
  auto first = get("a");
  auto second = get("a");
  EXPECT_EQ(calls(), (Words{"start /drive/a"}));
  first = nullptr;
  EXPECT_EQ(calls(), Words());
  next(*second);
  take().provided(nullptr);
  run();
  EXPECT_EQ(heard, (Words{"finished a"}));
  second = nullptr;
  EXPECT_EQ(calls(), Words());

  // By its own progress: told to stop, the extension would go by the path, and evict the file
  // when the download has just ended.
  auto third = get("a");
  const auto progress = NSProgress::progressWithTotalUnitCount(10);
  extension->transfers.front().progress->follow(progress);
  EXPECT_FALSE(progress->isCancelled());
  third = nullptr;
  EXPECT_TRUE(progress->isCancelled());
  EXPECT_EQ(calls(), (Words{"start /drive/a"}));
  // Who comes while it ends gets a download of their own.
  auto fourth = get("a");
  EXPECT_EQ(calls(), Words());
  take().provided(cancelled());
  EXPECT_EQ(calls(), (Words{"start /drive/a"}));
  const auto its = NSProgress::progressWithTotalUnitCount(10);
  extension->transfers.front().progress->follow(its);
  EXPECT_FALSE(its->isCancelled());
  // So does who wants more than is under way.
  auto newest = get("a", true);
  EXPECT_EQ(calls(), Words());
  take().provided(nullptr);
  EXPECT_EQ(calls(), (Words{"start /drive/a current"}));
  heard.clear();
  next(*newest);
  take().provided(cancelled());
  run();
  EXPECT_EQ(heard, (Words{"error 3072"}));
  EXPECT_EQ(get("gone"), nullptr);
  EXPECT_EQ(heard.back(), "error -1005");
}

// The extension's stop answers nothing; what came of it is asked beside it.
TEST_F(FileRequests, AFileIsGivenUpThroughTheExtensionAndOnlyWhenNobodyWantsIt) {
  const auto evict = [&] {
    files->evict(HostTarget::path("/a"), errorReply());
    run();
  };
  extension->whileStopping = [] { EvictionOutcomeScope::note(nullptr); };
  evict();
  extension->whileStopping = [] {
    EvictionOutcomeScope::note(NSError::errorWithDomain("SkeinEvictionErrorDomain", 3));
  };
  evict();
  EXPECT_EQ(heard, (Words{"done", "error 3"}));
  EXPECT_EQ(calls(), (Words{"stop /drive/a", "stop /drive/a"}));

  heard.clear();
  auto wanted = get("a");
  evict();
  EXPECT_EQ(heard, (Words{"error " + std::to_string(EBUSY)}));
  EXPECT_EQ(calls(), (Words{"start /drive/a"}));
  take().provided(nullptr);
  run();

  // Who comes during an eviction is served after it.
  std::shared_ptr<HostTransfer> meanwhile;
  extension->whileStopping = [&] {
    meanwhile = get("a");
    EvictionOutcomeScope::note(nullptr);
  };
  heard.clear();
  evict();
  EXPECT_EQ(calls(), (Words{"stop /drive/a", "start /drive/a"}));
  next(*meanwhile);
  take().provided(nullptr);
  run();
  EXPECT_EQ(heard, (Words{"done", "finished a"}));
}

TEST_F(FileRequests, WhatTheExtensionDoesNotOfferGoesToVald) {
  files->setPinned(HostTarget::path("/a"), true, errorReply());
  daemon->fakeFiles.url = NSURL::fileURLWithPath("/drive/link");
  daemon->item = std::dynamic_pointer_cast<const VLQueryItem>(extension->items["b"]);
  files->makeAlias(HostTarget::path("/a"), false, "link", HostTarget::path("/"), "me", itemReply());
  files->makeAlias(HostTarget::path("/etc"), true, "link", HostTarget::path("/"), "me",
                   itemReply());
  daemon->fakeFiles.entries = {{{}, "move", "me", "a", "/drive/a", "/elsewhere/a", false},
                               {{}, "import", "me", "a", "/drive/x", "/drive/a", false}};
  files->history(HostTarget::path("//a/"), 5,
                 [&](const std::vector<FileHistoryEntry>& entries, const NSErrorPtr&) {
                   for (const auto& entry : entries) {
                     heard.push_back(entry.path + " -> " + entry.destination);
                   }
                 });
  files->history(HostTarget::path("/gone"), 5, [](const auto&, const auto&) {});
  run();
  Words asked;
  while (daemon->fakeFiles.asked.count() > 0) asked.push_back(*daemon->fakeFiles.asked.take());
  EXPECT_EQ(asked, (Words{"setPinned /drive/a yes", "makeAlias /drive link /drive/a me",
                          "makeAlias /drive link /etc me", "history /drive/a a 5",
                          "history /drive/gone  5", "history /drive/gone a 5"}));
  // Paths in the drive are shown as the drive's, but for where an import came from.
  EXPECT_EQ(heard, (Words{"done", "b at /b", "b at /b", "/a -> /elsewhere/a", "/drive/x -> /a"}));
}

TEST_F(FileRequests, TheTrashComesInPages) {
  TrashedItem trashed;
  trashed.item = std::dynamic_pointer_cast<const VLQueryItem>(extension->items["a"]);
  trashed.url = NSURL::fileURLWithPath("/drive/.Trash-1/files/a");
  trashed.putBackURL = NSURL::fileURLWithPath("/drive/folder/a");
  daemon->fakeFiles.trashed = {trashed};
  daemon->fakeFiles.number = 7;
  std::shared_ptr<HostTrash> pages;
  files->trashedItems([&](std::shared_ptr<HostTrash> made, const NSErrorPtr&) { pages = made; });
  run();
  const auto ask = [&] {
    pages->next([&](const std::vector<HostTrashedItem>& items, bool last, const NSErrorPtr&) {
      heard.push_back(
          (items.empty() ? "none" : items[0].item.path + " was " + items[0].putBackPath) +
          (last ? " last" : ""));
    });
    run();
  };
  ask();
  daemon->fakeFiles.number = 0;
  ask();
  ask();
  EXPECT_EQ(heard, (Words{"/.Trash-1/files/a was /folder/a", "/.Trash-1/files/a was /folder/a last",
                          "none last"}));
  EXPECT_EQ(daemon->fakeFiles.asked.take(), "trashedItems 0 200");
  EXPECT_EQ(daemon->fakeFiles.asked.take(), "trashedItems 7 200");
  EXPECT_EQ(daemon->fakeFiles.asked.count(), 0U);
}

}  // namespace
}  // namespace skein
