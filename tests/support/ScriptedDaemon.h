#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/HeldCalls.h"
#include "tests/support/Transcript.h"
#include "vellum/VLDaemonConnection.h"

namespace skein {

// An item-update sender of the scripted daemon's. Like the daemon it holds its receiver
// until it is invalidated or dies.
class ScriptedSender final : public VLItemNotificationSender,
                             public std::enable_shared_from_this<ScriptedSender> {
 public:
  // `name` stands in the transcript's lines.
  ScriptedSender(std::string name, Transcript& transcript, CallLedger& ledger)
      : boosts(ledger), watches(ledger), _name(std::move(name)), _transcript(transcript) {}

  std::shared_ptr<VLItemNotificationSending> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) override;
  void boostPriority(Reply<> reply) override { boost(std::move(reply), nullptr); }
  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> gatherReply) override {
    watch(url, options, std::move(gatherReply), nullptr);
  }
  void invalidate() override;

  void holdReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver) SKEIN_EXCLUDES(_mutex);
  // The daemon's end of the link died.
  void releaseReceiver() { holdReceiver(nullptr); }
  std::shared_ptr<VLItemNotificationReceiving> receiver() const SKEIN_EXCLUDES(_mutex);

  HeldCalls<> boosts;
  HeldCalls<NSErrorPtr> watches;
  std::function<void()> invalidated;  // called as it is invalidated; set before threads start

 private:
  class Proxy;
  void boost(Reply<> reply, ErrorHandler errorHandler);
  void watch(const NSURLPtr& url, std::uint64_t options, Reply<NSErrorPtr> reply,
             ErrorHandler errorHandler);

  const std::string _name;
  Transcript& _transcript;
  mutable Mutex _mutex;
  std::shared_ptr<VLItemNotificationReceiving> _receiver SKEIN_GUARDED_BY(_mutex);
};

// The daemon and the connection to it. Calls go into the transcript with their arguments
// and are held. Any thread.
class ScriptedDaemon final : public VLDaemonConnection {
 public:
  ScriptedDaemon(Transcript& transcript, CallLedger& ledger)
      : pages(ledger),
        folderPages(ledger),
        ranks(ledger),
        workingSetChanges(ledger),
        senders(ledger),
        containerURLs(ledger),
        shareableChecks(ledger),
        sharingRefreshes(ledger),
        shareOptions(ledger),
        contentRecords(ledger),
        _transcript(transcript),
        _ledger(ledger) {}

  // Keeps what it makes, and so the error handlers, as a framework may.
  std::shared_ptr<VLDaemon> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) override SKEIN_EXCLUDES(_mutex);

  // A sender to answer `senders` with, named "sender N" from 1 on.
  std::shared_ptr<ScriptedSender> makeSender() SKEIN_EXCLUDES(_mutex);

  // The connection died: every sender lets go of its receiver.
  void releaseReceivers() SKEIN_EXCLUDES(_mutex);

  HeldCalls<NSFileProviderItems, std::uint64_t, NSErrorPtr> pages;
  HeldCalls<NSFileProviderItems, std::uint64_t, NSErrorPtr> folderPages;
  HeldCalls<std::uint64_t, NSErrorPtr> ranks;
  HeldCalls<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
      workingSetChanges;
  HeldCalls<std::shared_ptr<VLItemNotificationSender>, NSErrorPtr> senders;
  HeldCalls<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> containerURLs;
  HeldCalls<bool, NSErrorPtr> shareableChecks;
  HeldCalls<NSErrorPtr> sharingRefreshes;
  HeldCalls<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr>
      shareOptions;
  HeldCalls<std::optional<VLContentRecordIDs>, NSErrorPtr> contentRecords;

 private:
  class Proxy;

  Transcript& _transcript;
  CallLedger& _ledger;
  Mutex _mutex;
  std::vector<std::weak_ptr<ScriptedSender>> _senders SKEIN_GUARDED_BY(_mutex);
  std::vector<std::shared_ptr<VLDaemon>> _proxies SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
