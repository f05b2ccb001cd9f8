#include "linux/vald/scan/BackupNames.h"

#include <algorithm>

namespace skein::vald {
namespace {

constexpr std::string_view kBackupEndings[] = {"~",     ".bak", ".BAK", ".backup", ".orig", ".old",
                                               ".save", ".sav", ".swp", ".swo",    ".swx"};
constexpr std::string_view kTemporaryEndings[] = {".tmp", ".TMP", ".temp", ".part", ".new"};
constexpr std::string_view kTemporaryBeginnings[] = {
    ".goutputstream-", ".~", "~$", ".#", ".tmp", ".nfs", ".sb-", ".fuse_hidden"};

template <class List>
bool endsWithOneOf(std::string_view text, const List& endings) {
  return std::any_of(std::begin(endings), std::end(endings),
                     [&](std::string_view ending) { return text.ends_with(ending); });
}

}  // namespace

bool isBackupNameOf(std::string_view name, std::string_view original) {
  if (endsWithOneOf(name, kTemporaryEndings)) return true;
  if (std::any_of(std::begin(kTemporaryBeginnings), std::end(kTemporaryBeginnings),
                  [&](std::string_view beginning) { return name.starts_with(beginning); })) {
    return true;
  }
  if (original.empty()) return false;
  // "report.txt" is kept as "report.bak" too.
  const std::string_view stem = original.substr(0, original.rfind('.'));
  if (name.starts_with(original) || (!stem.empty() && name.starts_with(stem))) {
    return endsWithOneOf(name, kBackupEndings);
  }
  if (name.starts_with('.') && name.substr(1).starts_with(original)) return true;
  return name.size() == original.size() + 2 && name.starts_with('#') && name.ends_with('#') &&
         name.substr(1, original.size()) == original;
}

}  // namespace skein::vald
