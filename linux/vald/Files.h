#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/Executor.h"
#include "linux/protocol/LocalFiles.h"
#include "linux/vald/DocumentPlaces.h"
#include "linux/vald/FolderStore.h"
#include "linux/vald/Replies.h"
#include "linux/vald/TrashListings.h"
#include "linux/vald/cloud/Downloader.h"
#include "linux/vald/cloud/Eviction.h"
#include "linux/vald/files/FileOperations.h"
#include "vellum/VLErrors.h"

namespace skein::vald {

// What Files works with; each outlives it and what it posted.
struct FilesParts {
  FolderStore& store;
  FileOperations& operations;
  CloudPlaces places;
  Downloader& downloader;
  std::shared_ptr<Executor> executor;        // for what takes milliseconds
  std::shared_ptr<Executor> importExecutor;  // for what may take minutes; deletions too
  // Why a document may not be uploaded although nothing failed; empty when it will be.
  std::function<std::string(VLFileObjectID)> whyNotUploaded;
  // Told after it succeeded; both return soon.
  std::function<void(const std::string& path, VLFileObjectID)> didEvict;
  std::function<void(const std::string& path)> didDownload;
};

// Posts `work(reply)` to an executor.
template <class R, class Work>
void postAnswer(Executor& executor, R reply, Work work) {
  executor.post([reply = std::move(reply), work = std::move(work)]() mutable { work(reply); });
}

// What vald does to documents. Everything is posted to executors of its own, so that no
// listing waits for it, and answered from there once the store has seen what was done. A
// document that is not present is named by the path it would have; what is done to it is
// done to its marker. The executors are closed before this goes.
class Files final : public LocalFiles {
 public:
  explicit Files(FilesParts parts) : _parts(std::move(parts)), _eviction(_parts.places) {}

  std::shared_ptr<NSProgress> importDocument(NSURLPtr source, NSURLPtr folder,
                                             std::optional<std::string> name, RequestOrigin origin,
                                             URLReply reply) override;
  void createFolder(NSURLPtr folder, std::string name, RequestOrigin origin,
                    URLReply reply) override;
  void makeAlias(NSURLPtr folder, std::string name, std::string target, RequestOrigin origin,
                 URLReply reply) override;
  void rename(NSURLPtr url, std::string newName, RequestOrigin origin, URLReply reply) override;
  std::shared_ptr<NSProgress> move(NSURLPtr url, NSURLPtr folder,
                                   std::optional<std::string> newName, bool bounce,
                                   RequestOrigin origin, URLReply reply) override;
  std::shared_ptr<NSProgress> remove(NSURLPtr url, RequestOrigin origin,
                                     Reply<NSErrorPtr> reply) override;
  void trash(NSURLPtr url, RequestOrigin origin, URLReply reply) override;

  void putBackURL(NSURLPtr url, URLReply reply) override;
  void capabilityToMove(NSURLPtr url, NSURLPtr toURL,
                        Reply<std::uint64_t, NSErrorPtr> reply) override;
  void coordinateDeletion(NSURLPtr url, URLReply reply) override;
  void physicalURL(NSURLPtr url, Reply<NSURLPtr, bool, NSErrorPtr> reply) override;

  void setTagNames(NSURLPtr url, std::vector<std::string> names, Reply<NSErrorPtr> reply) override;
  void setLastOpenDate(NSURLPtr url, std::optional<NSDate> date, Reply<NSErrorPtr> reply) override;
  void setFavoriteRank(NSURLPtr url, std::optional<std::int64_t> rank,
                       Reply<NSErrorPtr> reply) override;
  void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) override;

  std::shared_ptr<NSProgress> download(NSURLPtr url, bool currentVersion,
                                       Reply<NSErrorPtr> reply) override;
  void evict(NSURLPtr url, Reply<NSErrorPtr> reply) override;
  void setPinned(NSURLPtr url, bool pinned, Reply<NSErrorPtr> reply) override;

  void trashedItems(std::uint64_t offset, std::uint64_t limit,
                    Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) override;
  void history(std::string path, std::string identifier, std::uint64_t limit,
               Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) override;

 private:
  // A request about one item: where it is, and who it is.
  struct Subject {
    DocumentPlace place;
    VLQueryItemPtr item;          // null when the store does not know it
    std::optional<FileKey> file;  // of an item that was named by its identifier
    // Why nothing can be done: the item that was named is not at the URL any more.
    NSErrorPtr error;
  };

  // Posts `work(reply)`, or the answer that a URL is missing.
  template <class R, class Work>
  void answer(const char* parameter, const NSURLPtr& url, R reply, Work work) {
    NSErrorPtr error = url ? nullptr : vlc_errorInvalidParameter(parameter, "(null)");
    postAnswer(*_parts.executor, std::move(reply),
               [error = std::move(error), work = std::move(work)](R& answered) mutable {
                 error ? answerError(answered, error) : work(answered);
               });
  }
  Subject subjectAt(const NSURLPtr& url);
  // Before the subject leaves its place. Null, or why it must not.
  NSErrorPtr willLeave(const Subject& subject) const;
  // Whether the item is at the subject's place; then the subject is that item.
  bool recognize(Subject& subject, VLFileObjectID id);
  // After an error, before anything else is looked at: what came between.
  void lookAgainAfter(const NSErrorPtr& error, const Subject& subject);
  FileRequest request(const Subject& subject, RequestOrigin origin) const;
  // Lets the store look, and answers with the path that people know.
  void answerResult(URLReply& reply, const FileResult& result, std::vector<std::string> touched);

  // Lets the store look while the disk is still written to, and answers after both.
  void answerMove(URLReply& reply, const Subject& subject, RequestOrigin origin,
                  const std::function<FileResult(const FileRequest&)>& move);

  FileResult renameEvicted(const Subject& subject, const std::string& newName,
                           const FileRequest& request);
  FileResult moveEvicted(const Subject& subject, const std::string& folder,
                         const std::optional<std::string>& newName, bool bounce,
                         const FileRequest& request);
  // Null, or why no marker can stand for a document of this name.
  NSErrorPtr refusalOfMarkerName(const Subject& subject, const std::string& name) const;

  // Notes on the file of an item that is there which document it is. Whether that changed it.
  bool writeHint(const Subject& subject);
  // Changes what the index keeps; and does that for a reply, and writes the hint.
  NSErrorPtr changeDetails(const Subject& subject, std::function<void(ItemDetails&)> change);
  void answerDetails(const NSURLPtr& url, std::function<void(ItemDetails&)> change,
                     Reply<NSErrorPtr> reply);
  void startDownload(const NSURLPtr& url, const std::shared_ptr<NSProgress>& progress,
                     Reply<NSErrorPtr> reply);
  // Everything in the trash, what was thrown away last first.
  TrashListings::Items trashInOrder(NSErrorOut error);
  TrashedItem trashedItem(VLQueryItemPtr item, const std::string& path) const;
  std::optional<NSDate> dateOfTrashing(const std::string& path) const;
  std::vector<FileHistoryEntry> historyOf(const std::string& path, const std::string& identifier,
                                          std::size_t limit, NSErrorOut error);
  void addRemovalsByOthers(const std::string& path, std::size_t limit,
                           std::vector<FileHistoryEntry>& entries);

  const FilesParts _parts;
  Eviction _eviction;
  TrashListings _trashListings;
};

}  // namespace skein::vald
