#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/cloud/ContentHash.h"
#include "linux/vald/cloud/ContentStream.h"
#include "linux/vald/cloud/Outcome.h"
#include "linux/vald/files/FileLayer.h"

namespace skein::vald {

// What documents hold, kept in a folder of its own and addressed by hash, so that equal
// contents are kept once:
//
//   objects/ab/ab12…   one file per contents, never changed once it stands there
//   incoming/          what is still being written; emptied when the folder is opened
//   key                32 bytes by chance, which markers are sealed with
//   keys               those of other drives of this user, as documents were copied from there
//
// A drive that was copied, or came back from a backup without its identity, has evicted documents
// whose contents only the other drive's cloud has. Their markers carry that cloud's seal; its key
// is taken over, and their contents get a second name here (or are copied, from another volume).
// So what either drive's cloud lets go of stays with the other.
//
// Contents appear by atomic rename when they are durable. Any thread; calls block.
class CloudContents {
 public:
  // Keeps contents from being collected while no record refers to them yet. Must not
  // outlive the CloudContents.
  class Hold {
   public:
    Hold() = default;
    Hold(Hold&& other) noexcept;
    Hold& operator=(Hold&& other) noexcept;
    ~Hold();

   private:
    friend class CloudContents;
    Hold(CloudContents* owner, const ContentHash& hash) : _owner(owner), _hash(hash) {}
    CloudContents* _owner = nullptr;
    ContentHash _hash;
  };

  struct Added {
    HashedContents contents;
    Hold hold;
  };

  // Makes the folder (and what is missing above it) when it does not stand, for its owner
  // alone. One CloudContents per folder; `files` outlives it. `drives`: holds the folders of all
  // of the user's drives, in each its "cloud"; empty: there are no others.
  static Outcome<std::unique_ptr<CloudContents>> open(const std::string& folder, FileLayer& files,
                                                      const std::string& drives = {});

  // Takes in a copy of `file`, from its start; shares its blocks where the file system can.
  // `name` is for errors. Contents that are there already are verified, and replaced when they
  // are damaged.
  Outcome<Added> add(int file, const std::string& name, StreamObserver& observer)
      SKEIN_EXCLUDES(_mutex);
  // Holds contents that are there with this size, perhaps only in another drive's cloud until now;
  // an empty optional when they are not.
  std::optional<Hold> hold(const HashedContents& contents) SKEIN_EXCLUDES(_mutex);

  // The seal of a marker's text; only this cloud makes the same.
  ContentHash seal(std::string_view text) const { return keyedHash(_key, text); }
  // Whether it was made by this cloud, or by that of another drive of this user's.
  bool isSeal(const ContentHash& seal, std::string_view text) SKEIN_EXCLUDES(_mutex);

  // For reading; NSCocoaErrorDomain 4 when there are no such contents.
  Outcome<FileDescriptor> read(const ContentHash& hash) const;
  // Null when the contents are there and are what their hash says.
  NSErrorPtr verify(const ContentHash& hash, StreamObserver& observer) const;

  struct Garbage {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
    Garbage& operator+=(const Garbage& other) {
      files += other.files;
      bytes += other.bytes;
      return *this;
    }
    Garbage& operator-=(const Garbage& other) {
      files -= other.files;
      bytes -= other.bytes;
      return *this;
    }
  };
  // Calls `each` with all contents but those that somebody holds, without a lock. An error: of
  // `each`, or of a folder that cannot be read.
  NSErrorPtr list(const std::function<NSErrorPtr(const HashedContents&)>& each)
      SKEIN_EXCLUDES(_mutex);
  // Removes contents. `release` is called once, with those that nobody holds, and answers
  // which of them may go; until they are gone, whoever wants to hold one of them waits.
  using Release = std::function<Outcome<std::vector<ContentHash>>(const std::vector<ContentHash>&)>;
  Outcome<Garbage> remove(const std::vector<ContentHash>& contents, const Release& release)
      SKEIN_EXCLUDES(_mutex);

 private:
  CloudContents(std::string folder, std::string drives, FileLayer& files, FileDescriptor objects,
                FileDescriptor incoming, std::string key)
      : _folder(std::move(folder)),
        _drives(std::move(drives)),
        _files(files),
        _objects(std::move(objects)),
        _incoming(std::move(incoming)),
        _key(std::move(key)) {}

  // Calls `each` with the folder of every other cloud until it answers true.
  void eachOther(const std::function<bool(const FileDescriptor&)>& each) const;
  // Takes the contents over from another cloud, if one has them. They are held.
  void takeOver(const HashedContents& contents) SKEIN_EXCLUDES(_mutex);
  NSErrorPtr keep(const std::string& key) SKEIN_REQUIRES(_mutex);

  // Waits while the contents are being collected.
  Hold takeHold(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);
  void releaseHold(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);
  // False when somebody holds them.
  bool beginCollecting(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);
  void endCollecting(const std::vector<ContentHash>& contents) SKEIN_EXCLUDES(_mutex);
  bool isHeld(const ContentHash& hash) SKEIN_EXCLUDES(_mutex);

  Outcome<Garbage> unlinkAll(const std::vector<ContentHash>& contents);
  bool contains(const HashedContents& contents) const;
  std::string objectPath(const std::string& object) const;
  // Moves what was written into its place. The hash is held.
  NSErrorPtr settle(const std::string& incoming, int file, const HashedContents& contents);

  const std::string _folder;
  const std::string _drives;
  FileLayer& _files;
  const FileDescriptor _objects;
  const FileDescriptor _incoming;
  const std::string _key;

  Mutex _mutex;
  CondVar _collected;
  std::vector<std::string> _otherKeys SKEIN_GUARDED_BY(_mutex);
  std::uint64_t _nextIncoming SKEIN_GUARDED_BY(_mutex) = 0;
  std::map<ContentHash, std::uint64_t> _holds SKEIN_GUARDED_BY(_mutex);
  std::set<ContentHash> _collecting SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
