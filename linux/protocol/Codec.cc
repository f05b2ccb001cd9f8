#include "linux/protocol/Codec.h"

#include <type_traits>
#include <utility>
#include <variant>

#include "base/Fault.h"

namespace skein::codec {
namespace {

// Errors beneath errors are cut off here; a cycle cannot be built, but a tower can.
constexpr int kDeepestError = 8;

void encodeToDepth(wire::Error::Builder builder, const NSError& error, int depth) {
  builder.setDomain(bytes(error.domain()));
  builder.setCode(error.code());
  auto entries = builder.initUserInfo(static_cast<unsigned>(error.userInfo().size()));
  unsigned at = 0;
  for (const auto& [key, value] : error.userInfo()) {
    auto entry = entries[at++];
    entry.setKey(bytes(key));
    std::visit(
        [&](const auto& present) {
          using T = std::decay_t<decltype(present)>;
          if constexpr (std::is_same_v<T, std::string>) {
            entry.setText(bytes(present));
          } else if constexpr (std::is_same_v<T, NSURLPtr>) {
            if (present) entry.setUrl(bytes(present->path()));
          } else if constexpr (std::is_same_v<T, NSErrorPtr>) {
            if (present && depth < kDeepestError) {
              encodeToDepth(entry.initError(), *present, depth + 1);
            }
          } else {
            const auto* item = dynamic_cast<const VLQueryItem*>(present.get());
            if (item != nullptr) encode(entry.initItem(), *item);
          }
        },
        value);
  }
}

NSErrorPtr decodeToDepth(wire::Error::Reader reader, int depth) {
  NSErrorUserInfo userInfo;
  for (const auto entry : reader.getUserInfo()) {
    std::string key = text(entry.getKey());
    switch (entry.which()) {
      case wire::Error::Entry::TEXT:
        if (entry.hasText()) userInfo.emplace(std::move(key), text(entry.getText()));
        break;
      case wire::Error::Entry::ERROR:
        if (entry.hasError() && depth < kDeepestError) {
          userInfo.emplace(std::move(key), decodeToDepth(entry.getError(), depth + 1));
        }
        break;
      case wire::Error::Entry::URL:
        if (entry.hasUrl()) {
          userInfo.emplace(std::move(key), NSURL::fileURLWithPath(text(entry.getUrl())));
        }
        break;
      case wire::Error::Entry::ITEM:
        if (entry.hasItem()) {
          userInfo.emplace(std::move(key), NSFileProviderItemPtr(decode(entry.getItem())));
        }
        break;
      default: break;  // of a later version
    }
  }
  return NSError::errorWithDomain(text(reader.getDomain()), reader.getCode(), std::move(userInfo));
}

VLFileObjectID objectID(std::uint64_t rawID, bool isInode) {
  return isInode ? VLFileObjectID::folderOrAliasWithRawID(rawID)
                 : VLFileObjectID::documentWithRawID(rawID);
}

}  // namespace

std::int64_t moment(const NSDate& date) { return date.time_since_epoch().count(); }
NSDate date(std::int64_t moment) { return NSDate(std::chrono::nanoseconds(moment)); }

capnp::Data::Reader bytes(const std::string& text) {
  return {reinterpret_cast<const kj::byte*>(text.data()), text.size()};
}

capnp::Data::Reader bytes(const NSData& data) { return {data.bytes(), data.length()}; }

std::string text(capnp::Data::Reader data) {
  return {reinterpret_cast<const char*>(data.begin()), data.size()};
}

void encode(wire::Error::Builder builder, const NSError& error) {
  encodeToDepth(builder, error, 0);
}

NSErrorPtr decode(wire::Error::Reader reader) { return decodeToDepth(reader, 0); }

void encode(wire::ObjectID::Builder builder, const VLFileObjectID& fileObjectID) {
  builder.setRawID(fileObjectID.rawID());
  builder.setIsInode(fileObjectID.isFolderOrAliasID());
}

VLFileObjectID decode(wire::ObjectID::Reader reader) {
  return objectID(reader.getRawID(), reader.getIsInode());
}

void encode(capnp::List<wire::ObjectID>::Builder builder, const std::vector<VLFileObjectID>& ids) {
  unsigned at = 0;
  for (const VLFileObjectID& id : ids) encode(builder[at++], id);
}

void encode(wire::Item::Builder builder, const VLQueryItem& item) {
  const VLQueryItem::Properties& from = item.properties();
  builder.setRawID(from.fileObjectID.rawID());
  builder.setIsInode(from.fileObjectID.isFolderOrAliasID());
  builder.setKind(static_cast<std::uint8_t>(from.kind));
  builder.setIsDead(from.isDead);
  builder.setIsTrashed(from.isTrashed);
  builder.setIsUploaded(from.isUploaded);
  builder.setIsDownloaded(from.isDownloaded);
  builder.setIsShared(from.isShared);
  builder.setCapabilities(from.capabilities);
  builder.setSize(from.size);
  if (from.creationDate) {
    builder.setHasCreationDate(true);
    builder.setCreationDate(moment(*from.creationDate));
  }
  if (from.contentModificationDate) {
    builder.setHasContentModificationDate(true);
    builder.setContentModificationDate(moment(*from.contentModificationDate));
  }
  if (from.lastUsedDate) {
    builder.setHasLastUsedDate(true);
    builder.setLastUsedDate(moment(*from.lastUsedDate));
  }
  if (from.favoriteRank) {
    builder.setHasFavoriteRank(true);
    builder.setFavoriteRank(*from.favoriteRank);
  }
  if (from.childItemCount) {
    builder.setHasChildItemCount(true);
    builder.setChildItemCount(*from.childItemCount);
  }
  if (from.itemIdentifier != from.fileObjectID.asString()) {
    builder.setItemIdentifier(bytes(from.itemIdentifier));
  }
  builder.setParentItemIdentifier(bytes(from.parentItemIdentifier));
  builder.setFilename(bytes(from.filename));
  if (from.typeIdentifier) builder.setTypeIdentifier(bytes(*from.typeIdentifier));
  if (from.tagData) builder.setTagData(bytes(*from.tagData));
  if (from.containerID) builder.setContainerID(bytes(*from.containerID));
}

VLQueryItemPtr decode(wire::Item::Reader reader) {
  VLQueryItem::Properties to;
  to.fileObjectID = objectID(reader.getRawID(), reader.getIsInode());
  to.kind = enumerator(reader.getKind(), VLQueryItem::Kind::Alias);
  to.isDead = reader.getIsDead();
  to.isTrashed = reader.getIsTrashed();
  to.isUploaded = reader.getIsUploaded();
  to.isDownloaded = reader.getIsDownloaded();
  to.isShared = reader.getIsShared();
  to.capabilities = reader.getCapabilities();
  to.size = reader.getSize();
  if (reader.getHasCreationDate()) to.creationDate = date(reader.getCreationDate());
  if (reader.getHasContentModificationDate()) {
    to.contentModificationDate = date(reader.getContentModificationDate());
  }
  if (reader.getHasLastUsedDate()) to.lastUsedDate = date(reader.getLastUsedDate());
  if (reader.getHasFavoriteRank()) to.favoriteRank = reader.getFavoriteRank();
  if (reader.getHasChildItemCount()) to.childItemCount = reader.getChildItemCount();
  to.itemIdentifier =
      reader.hasItemIdentifier() ? text(reader.getItemIdentifier()) : to.fileObjectID.asString();
  to.parentItemIdentifier = text(reader.getParentItemIdentifier());
  to.filename = text(reader.getFilename());
  if (reader.hasTypeIdentifier()) to.typeIdentifier = text(reader.getTypeIdentifier());
  if (reader.hasTagData()) {
    const auto data = reader.getTagData();
    to.tagData = NSData(std::span(data.begin(), data.size()));
  }
  if (reader.hasContainerID()) to.containerID = text(reader.getContainerID());
  return std::make_shared<const VLQueryItem>(std::move(to));
}

void encode(capnp::List<wire::Item>::Builder builder, const NSFileProviderItems& items) {
  unsigned at = 0;
  for (const NSFileProviderItemPtr& item : items) {
    auto place = builder[at++];
    if (const auto* known = dynamic_cast<const VLQueryItem*>(item.get())) {
      encode(place, *known);
    } else {
      reportFault("an item that is no VLQueryItem cannot cross the process");
      place.setIsDead(true);
    }
  }
}

void encode(capnp::List<wire::Item>::Builder builder, const VLQueryItems& items) {
  unsigned at = 0;
  for (const VLQueryItemPtr& item : items) encode(builder[at++], *item);
}

VLQueryItems decodeItems(capnp::List<wire::Item>::Reader reader) {
  VLQueryItems items;
  items.reserve(reader.size());
  for (const auto item : reader) items.push_back(decode(item));
  return items;
}

NSFileProviderItems decodeProviderItems(capnp::List<wire::Item>::Reader reader) {
  NSFileProviderItems items;
  items.reserve(reader.size());
  for (const auto item : reader) items.push_back(decode(item));
  return items;
}

void encode(capnp::List<capnp::Data>::Builder builder, const std::vector<std::string>& texts) {
  unsigned at = 0;
  for (const std::string& one : texts) builder.set(at++, bytes(one));
}

std::vector<std::string> decode(capnp::List<capnp::Data>::Reader reader) {
  std::vector<std::string> texts;
  texts.reserve(reader.size());
  for (const auto one : reader) texts.push_back(text(one));
  return texts;
}

}  // namespace skein::codec
