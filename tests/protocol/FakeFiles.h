// vald's file operations as a test scripts them: they note what they were asked and answer
// what they were told to; transfers run until the test ends them.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/protocol/LocalFiles.h"
#include "tests/protocol/Waiting.h"

namespace skein {

class FakeFiles final : public LocalFiles {
 public:
  // What is answered; set it before asking.
  NSURLPtr url;
  NSErrorPtr error;
  std::uint64_t number = 0;
  bool flag = false;
  std::vector<TagUse> tags;
  std::vector<TrashedItem> trashed;
  std::vector<FileHistoryEntry> entries;

  struct Transfer {
    std::shared_ptr<NSProgress> progress;
    URLReply reply;
  };
  Inbox<Transfer> transfers;
  bool holdsRemovals = false;  // else they are answered at once
  // Kept by what counts in it, which may come when the fake is gone.
  const std::shared_ptr<Inbox<int>> cancelled = std::make_shared<Inbox<int>>();
  Inbox<int>& cancellations = *cancelled;
  // What was asked, as text, in order.
  Inbox<std::string> asked;

  std::shared_ptr<NSProgress> importDocument(NSURLPtr source, NSURLPtr folder,
                                             std::optional<std::string> name, RequestOrigin origin,
                                             URLReply reply) override {
    note("import", {path(source), path(folder), name.value_or("nil"), origin});
    return begin(std::move(reply));
  }
  void createFolder(NSURLPtr folder, std::string name, RequestOrigin origin,
                    URLReply reply) override {
    note("createFolder", {path(folder), name, origin});
    reply(url, error);
  }
  void makeAlias(NSURLPtr folder, std::string name, std::string target, RequestOrigin origin,
                 URLReply reply) override {
    note("makeAlias", {path(folder), name, target, origin});
    reply(url, error);
  }
  void rename(NSURLPtr what, std::string newName, RequestOrigin origin, URLReply reply) override {
    note("rename", {path(what), newName, origin});
    reply(url, error);
  }
  std::shared_ptr<NSProgress> move(NSURLPtr what, NSURLPtr folder,
                                   std::optional<std::string> newName, bool bounce,
                                   RequestOrigin origin, URLReply reply) override {
    note("move",
         {path(what), path(folder), newName.value_or("nil"), bounce ? "bounce" : "plain", origin});
    reply(url, error);
    return NSProgress::progressWithTotalUnitCount(0);
  }
  std::shared_ptr<NSProgress> remove(NSURLPtr what, RequestOrigin origin,
                                     Reply<NSErrorPtr> reply) override {
    note("remove", {path(what), origin});
    if (!holdsRemovals) {
      reply(error);
      return NSProgress::progressWithTotalUnitCount(0);
    }
    return begin([reply = std::move(reply)](const NSURLPtr&, NSErrorPtr problem) mutable {
      reply(std::move(problem));
    });
  }
  void trash(NSURLPtr what, RequestOrigin origin, URLReply reply) override {
    note("trash", {path(what), origin});
    reply(url, error);
  }
  void putBackURL(NSURLPtr what, URLReply reply) override {
    note("putBackURL", {path(what)});
    reply(url, error);
  }
  void capabilityToMove(NSURLPtr what, NSURLPtr toURL,
                        Reply<std::uint64_t, NSErrorPtr> reply) override {
    note("capabilityToMove", {path(what), path(toURL)});
    reply(number, error);
  }
  void coordinateDeletion(NSURLPtr what, URLReply reply) override {
    note("coordinateDeletion", {path(what)});
    reply(url, error);
  }
  void physicalURL(NSURLPtr what, Reply<NSURLPtr, bool, NSErrorPtr> reply) override {
    note("physicalURL", {path(what)});
    reply(url, flag, error);
  }
  void setTagNames(NSURLPtr what, std::vector<std::string> names,
                   Reply<NSErrorPtr> reply) override {
    names.insert(names.begin(), path(what));
    note("setTagNames", std::move(names));
    reply(error);
  }
  void setLastOpenDate(NSURLPtr what, std::optional<NSDate> date,
                       Reply<NSErrorPtr> reply) override {
    note("setLastOpenDate",
         {path(what), date ? std::to_string(date->time_since_epoch().count()) : "nil"});
    reply(error);
  }
  void setFavoriteRank(NSURLPtr what, std::optional<std::int64_t> rank,
                       Reply<NSErrorPtr> reply) override {
    note("setFavoriteRank", {path(what), rank ? std::to_string(*rank) : "nil"});
    reply(error);
  }
  void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) override {
    note("tagsInUse", {after});
    reply(tags, error);
  }
  std::shared_ptr<NSProgress> download(NSURLPtr what, bool currentVersion,
                                       Reply<NSErrorPtr> reply) override {
    note("download", {path(what), currentVersion ? "current" : "any"});
    return begin([reply = std::move(reply)](NSURLPtr, NSErrorPtr failure) mutable {
      reply(std::move(failure));
    });
  }
  void evict(NSURLPtr what, Reply<NSErrorPtr> reply) override {
    note("evict", {path(what)});
    reply(error);
  }
  void setPinned(NSURLPtr what, bool pinned, Reply<NSErrorPtr> reply) override {
    note("setPinned", {path(what), pinned ? "yes" : "no"});
    reply(error);
  }
  void trashedItems(std::uint64_t offset, std::uint64_t limit,
                    Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) override {
    note("trashedItems", {std::to_string(offset), std::to_string(limit)});
    reply(trashed, number, error);
  }
  void history(std::string where, std::string identifier, std::uint64_t limit,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override {
    note("history", {where, identifier, std::to_string(limit)});
    reply(entries, error);
  }

 private:
  static std::string path(const NSURLPtr& what) { return what ? what->path() : "nil"; }
  void note(std::string text, const std::vector<std::string>& arguments) {
    for (const std::string& argument : arguments) text += ' ' + argument;
    asked.add(std::move(text));
  }
  std::shared_ptr<NSProgress> begin(URLReply reply) {
    auto progress = NSProgress::progressWithTotalUnitCount(0);
    progress->setCancellationHandler([counter = cancelled] { counter->add(1); });
    transfers.add({progress, std::move(reply)});
    return progress;
  }
};

}  // namespace skein
