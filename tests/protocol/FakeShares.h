// vald's shares as a test scripts them: they note what they were asked and answer what they
// were told to; while `holds` is set, what can be given up waits for the test.
#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/protocol/LocalShares.h"
#include "tests/protocol/Waiting.h"

namespace skein {

class FakeShares final : public LocalShares {
 public:
  // What is answered; set it before asking.
  CKSharePtr share;
  std::optional<std::string> text;
  NSURLPtr url;
  NSErrorPtr error;
  bool flag = false;
  ShareOptions options;
  std::vector<AttachedZone> zones;

  std::atomic<bool> holds{false};
  Inbox<Task> held;  // runs the answer
  // Kept by what counts in it, which may come when the fake is gone.
  const std::shared_ptr<Inbox<int>> cancelled = std::make_shared<Inbox<int>>();
  Inbox<int>& cancellations = *cancelled;
  // What was asked, as text, in order.
  Inbox<std::string> asked;
  Inbox<CKShare> given;

  std::shared_ptr<NSProgress> copyShare(
      NSURLPtr what, Reply<CKSharePtr, std::optional<std::string>, NSErrorPtr> reply) override {
    return begin("copyShare " + path(what),
                 [this, reply = std::move(reply)]() mutable { reply(share, text, error); });
  }
  std::shared_ptr<NSProgress> newShare(NSURLPtr what, ShareReply reply) override {
    return begin("newShare " + path(what),
                 [this, reply = std::move(reply)]() mutable { reply(share, error); });
  }
  std::shared_ptr<NSProgress> copyShareURL(NSURLPtr what,
                                           Reply<NSURLPtr, NSErrorPtr> reply) override {
    return begin("copyShareURL " + path(what),
                 [this, reply = std::move(reply)]() mutable { reply(url, error); });
  }
  std::shared_ptr<NSProgress> saveShare(CKShare what, ShareReply reply) override {
    given.add(what);
    return begin("saveShare " + what.rootRecordName,
                 [this, reply = std::move(reply)]() mutable { reply(share, error); });
  }
  std::shared_ptr<NSProgress> destroyShare(CKShare what, Reply<NSErrorPtr> reply) override {
    return begin("destroyShare " + what.rootRecordName,
                 [this, reply = std::move(reply)]() mutable { reply(error); });
  }
  std::shared_ptr<NSProgress> copyShareTokens(
      NSURLPtr what,
      Reply<std::optional<std::string>, std::optional<std::string>, NSErrorPtr> reply) override {
    return begin("copyShareTokens " + path(what),
                 [this, reply = std::move(reply)]() mutable { reply(text, std::nullopt, error); });
  }
  void answerInvitation(NSURLPtr shareURL, std::string participant, bool accepts,
                        Reply<NSErrorPtr> reply) override {
    asked.add("answer " + shareURL->absoluteString() + ' ' + participant +
              (accepts ? " yes" : " no"));
    reply(error);
  }
  void attachZone(NSURLPtr folder, CKRecordZoneID zone, CKShareParticipantPermission permission,
                  Reply<NSErrorPtr> reply) override {
    asked.add("attach " + path(folder) + ' ' + zone.zoneName + ' ' + zone.ownerName + ' ' +
              std::to_string(permission));
    reply(error);
  }
  void detachZone(NSURLPtr folder, Reply<NSErrorPtr> reply) override {
    asked.add("detach " + path(folder));
    reply(error);
  }
  void attachedZones(Reply<std::vector<AttachedZone>, NSErrorPtr> reply) override {
    reply(zones, error);
  }
  void isShareable(VLFileObjectID item, Reply<bool, NSErrorPtr> reply) override {
    asked.add("isShareable " + item.asString());
    reply(flag, error);
  }
  void refreshSharingState(NSFileProviderItemIdentifier item, Reply<NSErrorPtr> reply) override {
    asked.add("refresh " + item);
    reply(error);
  }
  void shareOptions(NSFileProviderItemIdentifier item,
                    Reply<ShareOptions, NSErrorPtr> reply) override {
    asked.add("options " + item);
    reply(options, error);
  }

 private:
  static std::string path(const NSURLPtr& what) { return what ? what->path() : "nil"; }
  std::shared_ptr<NSProgress> begin(std::string text, Task answer) {
    auto progress = NSProgress::progressWithTotalUnitCount(1);
    progress->setCancellationHandler([counter = cancelled] { counter->add(1); });
    asked.add(std::move(text));
    if (holds) {
      held.add(std::move(answer));
    } else {
      answer();
    }
    return progress;
  }
};

}  // namespace skein
