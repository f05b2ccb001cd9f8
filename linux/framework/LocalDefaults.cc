#include "linux/framework/LocalDefaults.h"

#include <glib.h>

#include <memory>

namespace skein {

std::string LocalDefaults::userPath() {
  return std::string(g_get_user_config_dir()) + "/skein/settings.ini";
}

std::int64_t LocalDefaults::minFileSizeForThumbnailTransfer() {
  const std::unique_ptr<GKeyFile, decltype(&g_key_file_unref)> file(g_key_file_new(),
                                                                    g_key_file_unref);
  if (!g_key_file_load_from_file(file.get(), _path.c_str(), G_KEY_FILE_NONE, nullptr)) {
    return kMinFileSizeForThumbnailTransfer;
  }
  GError* error = nullptr;
  const std::int64_t size =
      g_key_file_get_int64(file.get(), "Thumbnails", "minFileSizeForThumbnailTransfer", &error);
  if (error == nullptr) return size;
  g_error_free(error);
  return kMinFileSizeForThumbnailTransfer;
}

}  // namespace skein
