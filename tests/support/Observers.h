// Observers that write what they hear into a transcript, and the words they write.
#pragma once

#include <string>
#include <vector>

#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "tests/support/Transcript.h"
#include "vellum/VLQueryItem.h"

namespace skein {

// An error in a transcript: its domain and code, and "under" its underlying error.
std::string brief(const NSErrorPtr& error);

// A live or dead document of a given number.
VLQueryItemPtr makeItem(std::uint64_t rawID, bool isDead = false, std::string name = "doc");
inline std::string documentID(std::uint64_t rawID) {
  return VLFileObjectID::documentWithRawID(rawID).asString();
}

class RecordingObserver final : public NSFileProviderEnumerationObserver {
 public:
  explicit RecordingObserver(Transcript& transcript) : _transcript(transcript) {}
  void didEnumerateItems(const NSFileProviderItems& items) override;
  void finishEnumeratingUpToPage(std::optional<NSFileProviderPage> nextPage) override;
  void finishEnumeratingWithError(NSErrorPtr error) override;

  std::optional<NSFileProviderPage> nextPage;
  NSErrorPtr error;
  int finishes = 0;

 private:
  Transcript& _transcript;
};

// Lists are recorded as sorted counts of names; the batch itself is kept.
class RecordingChangeObserver final : public NSFileProviderChangeObserver {
 public:
  explicit RecordingChangeObserver(Transcript& transcript) : _transcript(transcript) {}
  void didUpdateItems(const NSFileProviderItems& items) override;
  void didDeleteItemsWithIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers) override;
  void finishEnumeratingChangesUpToSyncAnchor(NSFileProviderSyncAnchor anchor,
                                              bool moreComing) override;
  void finishEnumeratingWithError(NSErrorPtr error) override;

  NSFileProviderItems updated;
  std::vector<NSFileProviderItemIdentifier> deleted;
  std::optional<NSFileProviderSyncAnchor> anchor;
  bool moreComing = false;
  NSErrorPtr error;
  int finishes = 0;

 private:
  Transcript& _transcript;
};

}  // namespace skein
