// Between the schemas' common structs and the framework's values. Decoding throws kj
// exceptions for what no honest peer sends, which ends the one call that it came with.
#pragma once

#include <kj/debug.h>

#include <string>
#include <vector>

#include "linux/protocol/types.capnp.h"
#include "platform/foundation/NSData.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLFileObjectID.h"
#include "vellum/VLQueryItem.h"

namespace skein::codec {

// Bytes.
capnp::Data::Reader bytes(const std::string& text);
capnp::Data::Reader bytes(const NSData& data);
std::string text(capnp::Data::Reader data);

// Texts, errors, URLs and items of the user info cross; errors up to eight deep.
void encode(wire::Error::Builder builder, const NSError& error);
NSErrorPtr decode(wire::Error::Reader reader);
// The `error` field of any result; null when it has none.
template <class Results>
NSErrorPtr errorOf(const Results& results) {
  return results.hasError() ? decode(results.getError()) : nullptr;
}
// Leaves the field out for a null error.
template <class Results>
void setError(Results results, const NSErrorPtr& error) {
  if (error) encode(results.initError(), *error);
}
// The answer of a method whose only result is an error.
inline constexpr auto encodeError = [](auto results, const NSErrorPtr& error) {
  setError(results, error);
};

void encode(wire::ObjectID::Builder builder, const VLFileObjectID& fileObjectID);
VLFileObjectID decode(wire::ObjectID::Reader reader);
void encode(capnp::List<wire::ObjectID>::Builder builder, const std::vector<VLFileObjectID>& ids);

void encode(wire::Item::Builder builder, const VLQueryItem& item);
VLQueryItemPtr decode(wire::Item::Reader reader);
// Items of other classes than VLQueryItem are a fault and come out as dead items.
void encode(capnp::List<wire::Item>::Builder builder, const NSFileProviderItems& items);
void encode(capnp::List<wire::Item>::Builder builder, const VLQueryItems& items);
VLQueryItems decodeItems(capnp::List<wire::Item>::Reader reader);
NSFileProviderItems decodeProviderItems(capnp::List<wire::Item>::Reader reader);

void encode(capnp::List<capnp::Data>::Builder builder, const std::vector<std::string>& texts);
std::vector<std::string> decode(capnp::List<capnp::Data>::Reader reader);

// Nanoseconds since 1970.
std::int64_t moment(const NSDate& date);
NSDate date(std::int64_t moment);

// An enumerator that the receiving side knows.
template <class Enum>
Enum enumerator(std::uint8_t value, Enum last) {
  KJ_REQUIRE(value <= static_cast<std::uint8_t>(last), "unknown value", value);
  return static_cast<Enum>(value);
}

}  // namespace skein::codec
