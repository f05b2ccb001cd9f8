#include "platform/fileprovider/NSFileProviderItem.h"

namespace skein {

const NSFileProviderPage& NSFileProviderInitialPageSortedByName() {
  static const NSFileProviderPage page{std::string_view("NSFileProviderInitialPageSortedByName")};
  return page;
}

const NSFileProviderPage& NSFileProviderInitialPageSortedByDate() {
  static const NSFileProviderPage page{std::string_view("NSFileProviderInitialPageSortedByDate")};
  return page;
}

}  // namespace skein
