// What vald does to documents: the half of the daemon that changes the store. Stands on both
// sides of the socket, as LocalDaemon does.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLQueryItem.h"

namespace skein {

// Whose request a change is, in words that a person understands, such as "skein trash
// (process 4711)": what provenance tells. Empty when nobody said.
using RequestOrigin = std::string;

// Something in the trash.
struct TrashedItem {
  VLQueryItemPtr item;  // as it is now, in the trash
  NSURLPtr url;         // in the trash
  NSURLPtr putBackURL;  // where it was; null when that is not known
  std::optional<NSDate> trashed;
};

// One request that changed the store, as the journal of file operations keeps it.
struct FileHistoryEntry {
  NSDate when;
  std::string operation;    // "import", "create folder", "rename", "move", "remove", "trash", ...
  RequestOrigin origin;     // whose request
  std::string identifier;   // the item's; empty when it was not known
  std::string path;         // absolute; for an import, where it came from
  std::string destination;  // absolute; empty for a removal
  bool undone = false;      // it was cut off and has been taken back
};

struct TagUse {
  std::string name;
  std::uint64_t items = 0;
};

// Asynchronous, as VLDaemon: a call returns at once; its reply runs later, once, on a reply
// thread, or the proxy's error handler runs instead. URLs are absolute file URLs in the
// store unless said otherwise; a null one is answered with an invalid-parameter error. An
// item that is not present is named by the URL it would have. A URL that remembers an item (see
// DocumentURL.h) names that item: another one that stands there by now is left alone, and the
// answer is that the item is not there.
//
// Errors: NSCocoaErrorDomain 4 for what is not there, 516 with the colliding URL for a name
// that is taken, 513 for what permissions or the move rule forbid, 514 for a name that cannot
// be, 640 for a full disk. Nothing was changed then.
class LocalFiles {
 public:
  using URLReply = Reply<NSURLPtr, NSErrorPtr>;  // where the item is now

  virtual ~LocalFiles() = default;

  // Copies a file or a tree from anywhere into `folder`; a nil name keeps its own. The
  // progress counts bytes; cancelling it undoes the import, and the reply is
  // NSUserCancelledError unless the document has just appeared.
  virtual std::shared_ptr<NSProgress> importDocument(NSURLPtr source, NSURLPtr folder,
                                                     std::optional<std::string> name,
                                                     RequestOrigin origin, URLReply reply) = 0;
  virtual void createFolder(NSURLPtr folder, std::string name, RequestOrigin origin,
                            URLReply reply) = 0;
  // A reference called `name` in `folder` to an absolute path inside or outside the store.
  virtual void makeAlias(NSURLPtr folder, std::string name, std::string target,
                         RequestOrigin origin, URLReply reply) = 0;
  virtual void rename(NSURLPtr url, std::string newName, RequestOrigin origin, URLReply reply) = 0;
  // A nil name keeps the name (out of the trash: gets the one it had). `bounce`: a name that
  // is taken is tried again with a number. Between volumes it is a copy, compared, and a removal:
  // the progress counts bytes then, and cancelling it leaves the item where it was; the reply is
  // NSUserCancelledError unless it has just been moved.
  virtual std::shared_ptr<NSProgress> move(NSURLPtr url, NSURLPtr folder,
                                           std::optional<std::string> newName, bool bounce,
                                           RequestOrigin origin, URLReply reply) = 0;
  // For good. Cancelling the progress puts the item back where it was, and the reply is
  // NSUserCancelledError, unless the answer is on its way: nothing is deleted before that.
  virtual std::shared_ptr<NSProgress> remove(NSURLPtr url, RequestOrigin origin,
                                             Reply<NSErrorPtr> reply) = 0;
  virtual void trash(NSURLPtr url, RequestOrigin origin, URLReply reply) = 0;

  // Where a trashed item was; null with an error when that is not known.
  virtual void putBackURL(NSURLPtr url, URLReply reply) = 0;
  // The bits of the move rule; 0 with an error that says why for a move that cannot be.
  virtual void capabilityToMove(NSURLPtr url, NSURLPtr toURL,
                                Reply<std::uint64_t, NSErrorPtr> reply) = 0;
  // Waits until no operation, here or in another program that locks the document, is under
  // way at the URL. The reply's URL is where the item is then.
  virtual void coordinateDeletion(NSURLPtr url, URLReply reply) = 0;
  // Where the item's physical file is (the marker of a document that is not present, else
  // the URL itself), and whether `url` itself names such a marker.
  virtual void physicalURL(NSURLPtr url, Reply<NSURLPtr, bool, NSErrorPtr> reply) = 0;

  // Metadata. Tags replace the whole set; nil clears a date or a rank.
  virtual void setTagNames(NSURLPtr url, std::vector<std::string> names,
                           Reply<NSErrorPtr> reply) = 0;
  virtual void setLastOpenDate(NSURLPtr url, std::optional<NSDate> date,
                               Reply<NSErrorPtr> reply) = 0;
  virtual void setFavoriteRank(NSURLPtr url, std::optional<std::int64_t> rank,
                               Reply<NSErrorPtr> reply) = 0;
  // A page of the tags that items of the drive have, by name: those after `after`, empty for
  // the start. There are no more when none come.
  virtual void tagsInUse(std::string after, Reply<std::vector<TagUse>, NSErrorPtr> reply) = 0;

  // Makes a document's contents present; at once when they are. `currentVersion`: fetches the
  // cloud's newest revision when it is newer than what is present. The progress counts bytes
  // of the download; cancelling it ends this request, whose reply is NSUserCancelledError
  // unless the file has just appeared.
  virtual std::shared_ptr<NSProgress> download(NSURLPtr url, bool currentVersion,
                                               Reply<NSErrorPtr> reply) = 0;
  // Replaces an uploaded, unchanged document by its marker. A refusal says why, in
  // SkeinEvictionErrorDomain.
  virtual void evict(NSURLPtr url, Reply<NSErrorPtr> reply) = 0;
  // A pinned document is never evicted.
  virtual void setPinned(NSURLPtr url, bool pinned, Reply<NSErrorPtr> reply) = 0;

  // The trash, newest first, from `offset`; the number is the next page's offset, 0 at the end.
  virtual void trashedItems(std::uint64_t offset, std::uint64_t limit,
                            Reply<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr> reply) = 0;
  // What was done to the item at a path, or to whatever was there, newest first. `identifier`
  // empty: by path alone. At most `limit`.
  virtual void history(std::string path, std::string identifier, std::uint64_t limit,
                       Reply<std::vector<FileHistoryEntry>, NSErrorPtr> reply) = 0;
};

}  // namespace skein
