#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/launchservices/LSBundleProxy.h"

namespace skein {

// The apps that the desktop has installed, looked up anew each time. Any thread.
class LocalBundles final : public LSBundles {
 public:
  // `folders`: of desktop entries; see applicationFolders().
  explicit LocalBundles(std::vector<std::string> folders) : _folders(std::move(folders)) {}

  std::shared_ptr<const LSBundleProxy> bundleProxyForIdentifier(
      const std::string& identifier) override;

 private:
  const std::vector<std::string> _folders;
};

}  // namespace skein
