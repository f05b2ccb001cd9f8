// A host that does nothing to files says so, once per request.
#include <gtest/gtest.h>

#include "base/ThreadPool.h"
#include "linux/framework/UnsupportedFileOperations.h"

namespace skein {
namespace {

TEST(UnsupportedFiles, EveryRequestIsRefusedOnceInWords) {
  int refusals = 0;
  const auto refused = [&](const NSErrorPtr& error) {
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), NSFeatureUnsupportedError);
    EXPECT_TRUE(error->localizedDescription().starts_with("This host does not offer "));
    ++refusals;
  };
  const auto refusedURL = [&](const NSURLPtr& url, const NSErrorPtr& error) {
    EXPECT_FALSE(url);
    refused(error);
  };
  {
    // One worker: the answers come one after the other, and the end waits for them.
    UnsupportedFileOperations files(std::make_shared<ThreadPool>(1, "files"));
    files.fp_importUnderFolder(nullptr, nullptr, refusedURL);
    files.fp_createSubFolder(nullptr, "x", refusedURL);
    files.fp_renameWithNewName(nullptr, "x", refusedURL);
    files.fp_reparentUnderFolder_withNewName(nullptr, nullptr, "x", refusedURL);
    files.fp_reparentUnderFolder_allowBouncing(nullptr, nullptr, true, refusedURL);
    files.fp_deleteWithCompletionHandler(nullptr, refused);
  }
  EXPECT_EQ(refusals, 6);
}

TEST(UnsupportedFiles, ADownloadIsRefusedOrCancelledWhenItStarts) {
  UnsupportedOperations operations;
  for (const bool cancelled : {false, true}) {
    std::vector<std::int64_t> codes;
    const auto operation = operations.fileProvidingOperation(nullptr, 0);
    operation->setFileProvidingCompletion(
        [&](const NSErrorPtr& error) { codes.push_back(error->code()); });
    if (cancelled) operation->cancel();
    EXPECT_TRUE(codes.empty());
    operation->start();
    operation->cancel();
    EXPECT_EQ(codes, std::vector<std::int64_t>{cancelled ? NSUserCancelledError
                                                         : NSFeatureUnsupportedError});
  }
}

}  // namespace
}  // namespace skein
