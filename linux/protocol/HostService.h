// skein-host as the command line knows it. The same interface stands on both sides of the
// socket: the host's requests implement it, the connection's proxies do too.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/HostFiles.h"
#include "linux/protocol/HostThumbnails.h"
#include "linux/protocol/HostTypes.h"
#include "linux/protocol/LocalDaemon.h"

namespace skein {

// What happened to one item since it was last told of.
struct HostChange {
  enum class Kind : std::uint8_t { Created, Changed, Deleted };
  Kind kind = Kind::Changed;
  std::string identifier;
  std::string filename;  // of a deleted item: the last one known; may be empty
  // Set when the name changed.
  std::optional<std::string> previousFilename;
  NSFileProviderItemPtr item;  // null when deleted
};

struct HostChangeBatch {
  NSFileProviderItems updates;
  std::vector<std::string> deletions;
  NSData token;
  bool moreComing = false;
};

struct HostStatus {
  LocalDaemonStatus daemon;
  std::int64_t processID = 0;
  std::uint64_t watchedContainers = 0;
  bool debugLog = false;
};

struct HostDifference {
  enum class Kind : std::uint8_t {
    MissingInIndex,
    MissingInStore,
    Attributes,
    Identity,
    MissingInListing,  // on disk, not enumerated
    OnlyInListing,     // enumerated, not on disk
    Listing,           // the folder could not be listed, or an item is told wrongly
    Contents,          // the evicted document cannot come back
  };
  Kind kind = Kind::MissingInIndex;
  std::string path;
  std::string detail;
};

// How far a check is; the last one has `finished`.
struct HostCheckStep {
  std::vector<HostDifference> differences;
  std::uint64_t folders = 0;  // so far
  std::uint64_t items = 0;
  std::uint64_t verified = 0;  // evicted documents, in the cloud
  std::uint64_t verifiedBytes = 0;
  bool finished = false;
};

using HostListing = HostStream<NSFileProviderItems, bool>;  // a page; whether it is the last
using HostWatch = HostStream<std::vector<HostChange>>;      // waits until there is a change
using HostCheck = HostStream<HostCheckStep>;

// Asynchronous: each reply runs once, on any thread but the caller's, from where further
// calls may be made. An error comes with empty values.
class HostService {
 public:
  virtual ~HostService() = default;

  // Lists a folder, or with the reserved identifier all folders.
  virtual void list(HostTarget container, HostOrder order,
                    Reply<std::shared_ptr<HostListing>, NSErrorPtr> reply) = 0;
  virtual void item(HostTarget target, Reply<HostItem, NSErrorPtr> reply) = 0;
  virtual void identifierForPath(std::string path, Reply<std::string, NSErrorPtr> reply) = 0;
  virtual void pathForIdentifier(std::string identifier, Reply<std::string, NSErrorPtr> reply) = 0;
  // Replies once what changes from then on is told.
  virtual void watch(HostTarget container, Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply) = 0;
  // One batch of the working set's changes; nil: from the beginning.
  virtual void changesSince(std::optional<NSData> token,
                            Reply<HostChangeBatch, NSErrorPtr> reply) = 0;

  virtual void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) = 0;
  virtual void logIn(LocalAccount account, Reply<NSErrorPtr> reply) = 0;
  virtual void logOut(Reply<NSErrorPtr> reply) = 0;
  virtual void status(Reply<HostStatus, NSErrorPtr> reply) = 0;
  virtual void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) = 0;
  // Errors as LocalCloud says.
  virtual void setCloudConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) = 0;
  virtual void setCloudKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) = 0;
  virtual void collectCloud(Reply<LocalCloudCollection, NSErrorPtr> reply) = 0;
  // `quick`: of evicted documents it only looks whether there are contents of their size.
  virtual void check(bool quick, Reply<std::shared_ptr<HostCheck>, NSErrorPtr> reply) = 0;
  virtual void setDebugLog(bool enabled, Reply<NSErrorPtr> reply) = 0;

  // What changes documents. Lives as long as this.
  virtual HostFiles& files() = 0;
  // Pictures of items. The same holds for it.
  virtual HostThumbnails& thumbnails() = 0;
};

}  // namespace skein
