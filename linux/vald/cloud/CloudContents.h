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
  // alone. One CloudContents per folder; `files` outlives it.
  static Outcome<std::unique_ptr<CloudContents>> open(const std::string& folder, FileLayer& files);

  // Takes in a copy of `file`, from its start; shares its blocks where the file system can.
  // `name` is for errors. Contents that are there already are verified, and replaced when they
  // are damaged.
  Outcome<Added> add(int file, const std::string& name, StreamObserver& observer)
      SKEIN_EXCLUDES(_mutex);
  // Holds contents that are there with this size; an empty optional when they are not.
  std::optional<Hold> hold(const HashedContents& contents) SKEIN_EXCLUDES(_mutex);

  // The seal of a marker's text; only this cloud makes the same.
  ContentHash seal(std::string_view text) const { return keyedHash(_key, text); }

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
  CloudContents(std::string folder, FileLayer& files, FileDescriptor objects,
                FileDescriptor incoming, std::string key)
      : _folder(std::move(folder)),
        _files(files),
        _objects(std::move(objects)),
        _incoming(std::move(incoming)),
        _key(std::move(key)) {}

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
  FileLayer& _files;
  const FileDescriptor _objects;
  const FileDescriptor _incoming;
  const std::string _key;

  Mutex _mutex;
  CondVar _collected;
  std::uint64_t _nextIncoming SKEIN_GUARDED_BY(_mutex) = 0;
  std::map<ContentHash, std::uint64_t> _holds SKEIN_GUARDED_BY(_mutex);
  std::set<ContentHash> _collecting SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
