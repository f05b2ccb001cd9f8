#include "linux/framework/LocalDownloads.h"

#include "vellum/VLErrors.h"

namespace skein {

void LocalDownloads::VLStartDownloadForItemsWithOptions(
    const std::vector<NSURLPtr>& items, std::uint64_t /*options*/,
    UniqueFunction<void(NSErrorPtr)> completion) {
  NSErrorPtr error;
  for (const NSURLPtr& url : items) {
    if (!url) {
      error = vlc_errorInvalidParameter("items", "(null)");
      continue;
    }
    const auto didEnd = [&log = _log, url](const NSErrorPtr& failure) {
      if (failure) VL_ERROR(log, "[ERROR] the download of %@ failed: %@", url, failure);
    };
    _access.client->remoteObjectProxyWithErrorHandler(didEnd)->files().download(
        url, /*currentVersion=*/false, didEnd);
  }
  // Never inside this call: whoever starts a download may hold a lock that this wants.
  _access.executor->post(
      [completion = std::move(completion), error]() mutable { completion(std::move(error)); });
}

}  // namespace skein
