#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "vellum/VLFileObjectID.h"

namespace skein {

// The framework's File Provider item: what vald knows of a document, folder or alias.
// Immutable; any thread.
class VLQueryItem final : public NSFileProviderItem {
 public:
  enum class Kind : std::uint8_t { Document, Folder, Alias };

  struct Properties {
    VLFileObjectID fileObjectID = VLFileObjectID::documentWithRawID(0);
    // What the host calls the item: the object identifier's string, but for the root.
    NSFileProviderItemIdentifier itemIdentifier;
    NSFileProviderItemIdentifier parentItemIdentifier;
    std::string filename;
    std::optional<std::string> typeIdentifier;
    Kind kind = Kind::Document;
    bool isDead = false;
    bool isTrashed = false;
    bool isUploaded = false;
    bool isDownloaded = true;
    bool isShared = false;
    std::uint64_t capabilities = 0;
    std::uint64_t size = 0;
    std::optional<NSDate> creationDate;
    std::optional<NSDate> contentModificationDate;
    std::optional<NSDate> lastUsedDate;
    std::optional<NSData> tagData;
    std::optional<std::int64_t> favoriteRank;
    std::optional<std::uint64_t> childItemCount;
    // Set for the documents folder of an app's container.
    std::optional<std::string> containerID;

    friend bool operator==(const Properties&, const Properties&) = default;
  };

  explicit VLQueryItem(Properties properties) : _properties(std::move(properties)) {}

  const Properties& properties() const { return _properties; }
  const VLFileObjectID& fileObjectID() const { return _properties.fileObjectID; }
  // The item is gone; only its identifiers mean anything.
  bool isDead() const { return _properties.isDead; }

  NSFileProviderItemIdentifier itemIdentifier() const override {
    return _properties.itemIdentifier;
  }
  NSFileProviderItemIdentifier parentItemIdentifier() const override {
    return _properties.parentItemIdentifier;
  }
  std::string filename() const override { return _properties.filename; }
  std::optional<std::string> typeIdentifier() const override { return _properties.typeIdentifier; }
  std::uint64_t capabilities() const override { return _properties.capabilities; }
  std::optional<std::uint64_t> documentSize() const override {
    if (isFolder()) return std::nullopt;
    return _properties.size;
  }
  std::optional<NSDate> creationDate() const override { return _properties.creationDate; }
  std::optional<NSDate> contentModificationDate() const override {
    return _properties.contentModificationDate;
  }
  std::optional<NSDate> lastUsedDate() const override { return _properties.lastUsedDate; }
  std::optional<NSData> tagData() const override { return _properties.tagData; }
  std::optional<std::int64_t> favoriteRank() const override { return _properties.favoriteRank; }
  std::optional<std::uint64_t> childItemCount() const override {
    return _properties.childItemCount;
  }
  bool isFolder() const override { return _properties.kind == Kind::Folder; }
  bool isTrashed() const override { return _properties.isTrashed; }
  bool isUploaded() const override { return _properties.isUploaded; }
  bool isDownloaded() const override { return _properties.isDownloaded; }
  bool isShared() const override { return _properties.isShared; }

 private:
  const Properties _properties;
};

using VLQueryItemPtr = std::shared_ptr<const VLQueryItem>;
using VLQueryItems = std::vector<VLQueryItemPtr>;

}  // namespace skein
