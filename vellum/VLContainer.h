#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>

#include "platform/foundation/NSData.h"
#include "platform/foundation/NSSize.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// Posted when a container came, went or changed its name or icon.
inline constexpr char VLContainerListDidChangeNotification[] =
    "VLContainerListDidChangeNotification";

// The drive's own containers; every other identifier belongs to an app.
inline constexpr char VLUbiquitousDefaultContainerID[] = "com.tessel.Skein.default";
inline constexpr char VLUbiquitousDocumentsContainerID[] = "com.tessel.Skein.Documents";
inline constexpr char VLUbiquitousDesktopContainerID[] = "com.tessel.Skein.Desktop";

// The names of the folders at the drive's root that hold the last two.
inline constexpr char VLUbiquitousDocumentsFolderName[] = "Documents";
inline constexpr char VLUbiquitousDesktopFolderName[] = "Desktop";

// A container: where one app (or the drive itself) keeps documents. Immutable.
class VLContainer {
 public:
  struct Properties {
    std::string containerID;
    // The folder of documents; null while the container has none.
    NSURLPtr documentsURL;
    std::string displayName;
    // The icon's name in the icon theme, or an absolute path.
    std::optional<std::string> icon;
    // The icon is to be shown as the app's own, without a folder around it.
    bool isIconUndecorated = false;
  };

  explicit VLContainer(Properties properties) : _properties(std::move(properties)) {}
  virtual ~VLContainer() = default;

  const std::string& containerID() const { return _properties.containerID; }
  const NSURLPtr& documentsURL() const { return _properties.documentsURL; }
  const std::string& displayName() const { return _properties.displayName; }
  const std::optional<std::string>& icon() const { return _properties.icon; }
  bool isIconUndecorated() const { return _properties.isIconUndecorated; }

  // bestFittingImageDataForSize:shouldTransformToAppIcon:
  // The icon's image that fits a size in points best, as a picture file's bytes; nil when
  // there is none. The flag is set to whether it must be shown as an app icon. Reads files.
  // A container as the daemon describes it has no images; the framework's own do.
  virtual std::optional<NSData> bestFittingImageDataForSize(
      NSSize /*size*/, bool& /*shouldTransformToAppIcon*/) const {
    return std::nullopt;
  }

 private:
  const Properties _properties;
};

using VLContainersByID = std::map<std::string, std::shared_ptr<const VLContainer>>;

// The container class's own methods. Any thread; both may ask the daemon.
class VLContainers {
 public:
  virtual ~VLContainers() = default;

  // Every container by its identifier; empty when the daemon cannot be asked.
  virtual VLContainersByID allContainersByContainerID() = 0;

  // The same table. From the first call on, VLContainerListDidChangeNotification is
  // posted in this process.
  virtual VLContainersByID allContainers() = 0;
};

}  // namespace skein
