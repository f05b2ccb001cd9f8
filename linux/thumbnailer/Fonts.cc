#include "linux/thumbnailer/Fonts.h"

#include <fontconfig/fontconfig.h>

namespace skein::thumbnailer {

std::vector<std::string> prepareFonts() {
  std::vector<std::string> folders;
  if (FcInit() == FcFalse) return folders;
  FcConfigSetRescanInterval(nullptr, 0);
  const FcFontSet* fonts = FcConfigGetFonts(nullptr, FcSetSystem);
  if (fonts == nullptr || fonts->nfont == 0) return folders;
  FcStrList* list = FcConfigGetFontDirs(nullptr);
  while (const FcChar8* folder = FcStrListNext(list)) {
    folders.emplace_back(reinterpret_cast<const char*>(folder));
  }
  FcStrListDone(list);
  folders.emplace_back("/usr/share/poppler");
  return folders;
}

}  // namespace skein::thumbnailer
