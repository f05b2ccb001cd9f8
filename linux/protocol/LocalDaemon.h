// vald as the local host knows it: the framework's daemon, and what only this host has
// (accounts, containers, status, checks). The same interface stands on both sides of
// the socket: vald's core implements it, the connection's proxies do too.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/LocalCloud.h"
#include "linux/protocol/LocalFiles.h"
#include "linux/protocol/LocalRecords.h"
#include "linux/protocol/LocalShares.h"
#include "vellum/VLContainer.h"
#include "vellum/VLDaemonConnection.h"

namespace skein {

struct LocalAccount {
  std::string name;
  // nil: an account that counts as logged out.
  std::optional<std::string> perAppAccountIdentifier;

  friend bool operator==(const LocalAccount&, const LocalAccount&) = default;
};

// What is true of vald at the moment.
struct LocalDaemonStatus {
  enum class Scan : std::uint8_t { Idle, First, Verifying, Rescanning };
  enum class Watch : std::uint8_t { Complete, Degraded };

  std::string store;  // the drive's folder, absolute
  std::int64_t processID = 0;
  std::uint64_t documents = 0;
  std::uint64_t folders = 0;
  std::uint64_t aliases = 0;
  Scan scan = Scan::Idle;
  std::uint64_t scannedFolders = 0;  // of the running scan
  std::uint64_t pendingFolders = 0;
  std::uint64_t unreadableFolders = 0;
  Watch watch = Watch::Complete;
  std::string watchReason;  // why it is degraded, in words; empty when complete
  std::uint64_t watches = 0;
  std::uint64_t watchBudget = 0;
  std::uint64_t overflows = 0;        // since the start
  std::uint64_t rank = 0;             // the newest change's
  std::uint64_t oldestTokenRank = 0;  // older tokens are expired
  std::uint64_t senders = 0;          // update senders that are alive
  std::optional<LocalAccount> account;
  // What is not as it should be, or not as one may expect: a sentence each, with the name of
  // the file or folder.
  std::vector<std::string> notes;
};

// One difference between the store on disk and the index.
struct IndexDifference {
  enum class Kind : std::uint8_t { MissingInIndex, MissingInStore, Attributes, Identity };
  Kind kind = Kind::MissingInIndex;
  std::string path;  // absolute
  std::string detail;
};

// "The next call of `method` answers this": for tests and trials. Reaches only the
// owner of the socket, and only a vald that was started with fault injection allowed.
// checkIndex, injectFault and stop have no faults. "fetchRecords ZONE:OWNER" reaches the
// cloud's answer of that zone alone, which a client may still cancel.
struct FaultInjection {
  enum class Action : std::uint8_t { AnswerError, DropConnection, Delay };
  std::string method;  // as the schemas name it, such as "enumerateAllFolders" or "watchItem"
  Action action = Action::AnswerError;
  std::string errorDomain;
  std::int64_t errorCode = 0;
  std::uint32_t delayMilliseconds = 0;
  std::uint32_t times = 1;
};

// Pushed by vald to each subscriber, on a delivery thread.
class LocalDaemonEvents {
 public:
  virtual ~LocalDaemonEvents() = default;
  virtual void accountDidChange(std::optional<LocalAccount> account) = 0;
  virtual void containerListDidChange() = 0;
};

// Threads, replies and errors as VLDaemon says.
class LocalDaemon : public VLDaemon {
 public:
  // What it does to documents. Lives as long as this object; a proxy's has the same error
  // handler.
  virtual LocalFiles& files() = 0;
  // The cloud's records, likewise.
  virtual LocalRecords& records() = 0;
  // Its shares, likewise.
  virtual LocalShares& shares() = 0;
  // The local cloud itself, likewise.
  virtual LocalCloud& cloud() = 0;

  // The framework's questions about sharing, asked of shares().
  void checkIfItemIsShareableWithInode(std::uint64_t inode, Reply<bool, NSErrorPtr> reply) final;
  void refreshSharingStateForItemIdentifier(const NSFileProviderItemIdentifier& identifier,
                                            Reply<NSErrorPtr> reply) final;
  void getShareOptionsOfItemIdentifier(
      const NSFileProviderItemIdentifier& identifier,
      Reply<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr> reply)
      final;
  // And about the cloud's records, of records().
  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) final;

  // Null URL and an error for an identifier that names nothing.
  virtual void URLForFileObjectID(VLFileObjectID fileObjectID,
                                  Reply<NSURLPtr, NSErrorPtr> reply) = 0;
  // The same of many in one message: as many URLs in their order, null for what names
  // nothing. An error when none could be looked up.
  virtual void URLsForFileObjectIDs(std::vector<VLFileObjectID> fileObjectIDs,
                                    Reply<std::vector<NSURLPtr>, NSErrorPtr> reply) = 0;

  // The item at an absolute path inside the store, also one that came a moment ago.
  // `scanFirst`: look at the file before answering. Null item and NSCocoaErrorDomain 4 when
  // there is none.
  virtual void queryItemForURL(NSURLPtr url, bool scanFirst,
                               Reply<VLQueryItemPtr, NSErrorPtr> reply) = 0;

  virtual void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) = 0;
  // Survives a restart. Replaces the account that was logged in.
  virtual void logIn(LocalAccount account, Reply<NSErrorPtr> reply) = 0;
  virtual void logOut(Reply<NSErrorPtr> reply) = 0;

  virtual void containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) = 0;

  // `events` is called until the connection ends or `events` dies. Both sides hold it
  // weakly: vald's core does, so the server keeps it alive while the connection lives;
  // and the connection does, so the subscriber keeps its own.
  virtual void subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) = 0;

  virtual void status(Reply<LocalDaemonStatus, NSErrorPtr> reply) = 0;

  // Walks the store and compares it with the index. At most `limit` differences.
  virtual void checkIndex(std::uint64_t limit,
                          Reply<std::vector<IndexDifference>, NSErrorPtr> reply) = 0;

  virtual void injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) = 0;

  // Replies, then ends the process in order.
  virtual void stop(Reply<NSErrorPtr> reply) = 0;
};

}  // namespace skein
