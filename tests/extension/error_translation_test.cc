// What the host is told of an error.
#include <gtest/gtest.h>

#include "extension/ItemIdentity.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "support/NSError+VLFPAdditions.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

TEST(ErrorTranslation, MapsAHandfulAndLeavesTheRestAlone) {
  const struct {
    const char* domain;
    std::int64_t code;
    std::int64_t result;  // 0: none
  } kCases[] = {
      {NSCocoaErrorDomain, 4355, -1004}, {NSCocoaErrorDomain, 4354, -1003},
      {NSCocoaErrorDomain, 14, -1005},   {VLVellumErrorDomain, 2, -1000},
      {NSCocoaErrorDomain, 4, 0},        {NSCocoaErrorDomain, 2, 0},
      {VLVellumErrorDomain, 14, 0},      {VLVellumErrorDomain, 4354, 0},
      {NSPOSIXErrorDomain, 14, 0},       {NSFileProviderErrorDomain, -1002, 0},
  };
  for (const auto& [domain, code, result] : kCases) {
    const NSErrorPtr source = NSError::errorWithDomain(domain, code);
    const NSErrorPtr translated = vl_fileProviderError(source);
    std::int64_t given = 77;
    EXPECT_EQ(_vl_getFileProviderDomainErrorCode(source, &given), result != 0) << brief(source);
    EXPECT_EQ(_vl_getFileProviderDomainErrorCode(source, nullptr), result != 0);
    EXPECT_EQ(given, result != 0 ? result : 77) << brief(source);
    if (result == 0) {
      EXPECT_EQ(translated, source) << "not the same object: " << brief(source);
      continue;
    }
    EXPECT_EQ(translated->domain(), NSFileProviderErrorDomain);
    EXPECT_EQ(translated->code(), result);
    EXPECT_EQ(translated->userInfo(), (NSErrorUserInfo{{NSUnderlyingErrorKey, source}}));
  }
  EXPECT_EQ(vl_fileProviderError(nullptr), nullptr);
  EXPECT_FALSE(_vl_getFileProviderDomainErrorCode(nullptr, nullptr));
}

TEST(ErrorTranslation, AFileThatExistsBecomesACollisionWhenItsItemIsKnown) {
  TestEnvironment env;
  ItemIdentity identity(env.environment);
  const VLQueryItemPtr item = makeItem(1);
  env.framework.queryItems.items["/store/a"] = item;
  const auto exists = [](std::int64_t code, const char* domain, const NSURLPtr& url) {
    return NSError::errorWithDomain(
        domain, code, url ? NSErrorUserInfo{{NSURLErrorKey, url}} : NSErrorUserInfo());
  };

  const NSErrorPtr collision =
      fileProviderErrorFromFSError(exists(516, NSCocoaErrorDomain, storeURL("/a")), identity);
  EXPECT_EQ(brief(collision), "NSFileProviderErrorDomain -1001");
  // The item is there already: no scan is asked for.
  EXPECT_EQ(env.runCalls(), Lines{"items: ask file:///store/a"});
  EXPECT_EQ(collision->userInfo().at(NSFileProviderErrorCollidingItemKey),
            NSErrorValue(NSFileProviderItemPtr(item)));

  env.framework.queryItems.error = NSError::errorWithDomain(NSCocoaErrorDomain, 4);
  for (const NSErrorPtr& unchanged :
       {exists(516, NSCocoaErrorDomain, storeURL("/unknown")),
        exists(516, NSCocoaErrorDomain, NSURL::fileURLWithPath("/elsewhere/a")),
        exists(516, NSCocoaErrorDomain, nullptr), exists(512, NSCocoaErrorDomain, storeURL("/a")),
        exists(516, NSPOSIXErrorDomain, storeURL("/a")), NSErrorPtr()}) {
    EXPECT_EQ(fileProviderErrorFromFSError(unchanged, identity), unchanged);
  }
}

}  // namespace
}  // namespace skein
