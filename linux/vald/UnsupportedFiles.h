// Temporary: what vald answers until its store and its cloud stand behind LocalFiles. Every
// call is refused with NSFeatureUnsupportedError.
#pragma once

#include <memory>
#include <utility>

#include "base/Executor.h"
#include "linux/protocol/LocalFiles.h"
#include "linux/vald/Replies.h"

namespace skein::vald {

class UnsupportedFiles final : public LocalFiles {
 public:
  explicit UnsupportedFiles(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}

  std::shared_ptr<NSProgress> importDocument(NSURLPtr, NSURLPtr, std::optional<std::string>,
                                             RequestOrigin, URLReply reply) override {
    refuse(std::move(reply));
    return NSProgress::progressWithTotalUnitCount(0);
  }
  void createFolder(NSURLPtr, std::string, RequestOrigin, URLReply reply) override {
    refuse(std::move(reply));
  }
  void makeAlias(NSURLPtr, std::string, std::string, RequestOrigin, URLReply reply) override {
    refuse(std::move(reply));
  }
  void rename(NSURLPtr, std::string, RequestOrigin, URLReply reply) override {
    refuse(std::move(reply));
  }
  void move(NSURLPtr, NSURLPtr, std::optional<std::string>, bool, RequestOrigin,
            URLReply reply) override {
    refuse(std::move(reply));
  }
  void remove(NSURLPtr, RequestOrigin, Reply<NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void trash(NSURLPtr, RequestOrigin, URLReply reply) override { refuse(std::move(reply)); }
  void putBackURL(NSURLPtr, URLReply reply) override { refuse(std::move(reply)); }
  void capabilityToMove(NSURLPtr, NSURLPtr, Reply<std::uint64_t, NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void coordinateDeletion(NSURLPtr, URLReply reply) override { refuse(std::move(reply)); }
  void physicalURL(NSURLPtr, Reply<NSURLPtr, bool, NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void setTagNames(NSURLPtr, std::vector<std::string>, Reply<NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void setLastOpenDate(NSURLPtr, std::optional<NSDate>, Reply<NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void setFavoriteRank(NSURLPtr, std::optional<std::int64_t>, Reply<NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void tagsInUse(Reply<std::vector<TagUse>, NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  std::shared_ptr<NSProgress> download(NSURLPtr, bool, Reply<NSErrorPtr> reply) override {
    refuse(std::move(reply));
    return NSProgress::progressWithTotalUnitCount(0);
  }
  void evict(NSURLPtr, Reply<NSErrorPtr> reply) override { refuse(std::move(reply)); }
  void setPinned(NSURLPtr, bool, Reply<NSErrorPtr> reply) override { refuse(std::move(reply)); }
  void trashedItems(std::uint64_t, std::uint64_t,
                    Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }
  void history(std::string, std::string, std::uint64_t,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override {
    refuse(std::move(reply));
  }

 private:
  template <class R>
  void refuse(R reply) {
    _executor->post([reply = std::move(reply)]() mutable {
      answerError(reply, NSError::errorWithDomain(NSCocoaErrorDomain, NSFeatureUnsupportedError));
    });
  }

  const std::shared_ptr<Executor> _executor;
};

}  // namespace skein::vald
