#include "linux/vald/MovedDrive.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/index/Sqlite.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// Each statement takes the new path, how long the old one is, and the old one.
constexpr const char* kJournal[] = {
    "UPDATE operation SET path = CAST(?1 || substr(path, ?2 + 1) AS BLOB) "
    "WHERE substr(path, 1, ?2 + 1) = ?3",
    "UPDATE operation SET destination = CAST(?1 || substr(destination, ?2 + 1) AS BLOB) "
    "WHERE substr(destination, 1, ?2 + 1) = ?3",
    "UPDATE operation SET aside = CAST(?1 || substr(aside, ?2 + 1) AS BLOB) "
    "WHERE substr(aside, 1, ?2 + 1) = ?3"};
constexpr const char* kCloud[] = {
    "UPDATE work SET path = CAST(?1 || substr(path, ?2 + 1) AS BLOB) "
    "WHERE substr(path, 1, ?2 + 1) = ?3"};

template <class Statements>
NSErrorPtr move(const std::string& file, const Statements& statements, const std::string& from,
                const std::string& to) {
  struct stat status {};
  if (lstat(file.c_str(), &status) != 0 && errno == ENOENT) return nullptr;
  int code = 0;
  std::string message;
  const auto database = SqliteDatabase::open(file, true, code, message);
  if (database) {
    const std::string below = from + '/';
    database->begin();
    for (const char* sql : statements) {
      SqliteStatement(*database, sql).start(std::string_view(to), from.size(), below).run();
    }
    if (database->commit()) return nullptr;
    message = database->message();
  }
  return vl_errorWithPOSIXCode(EIO,
                               "The paths in " + file + " can't be moved along: " + message + ".");
}

}  // namespace

NSErrorPtr followMovedDrive(const std::string& stateDirectory, const std::string& cloudDirectory,
                            const std::string& store) {
  const std::string note = joinPath(stateDirectory, "served");
  std::ifstream noted(note, std::ios::binary);
  const std::string from{std::istreambuf_iterator<char>(noted), {}};
  if (from == store) return nullptr;
  if (!from.empty()) {
    NSErrorPtr error = move(joinPath(stateDirectory, "operations.db"), kJournal, from, store);
    if (!error) error = move(joinPath(cloudDirectory, "records.db"), kCloud, from, store);
    if (error) return error;
  }
  const std::string partial = note + ".new";
  std::ofstream file(partial, std::ios::binary | std::ios::trunc);
  file << store;
  file.close();
  std::error_code failure;
  if (file) std::filesystem::rename(partial, note, failure);
  if (!file || failure) return fileError(failure ? failure.value() : EIO, "can't write", note);
  return nullptr;
}

}  // namespace skein::vald
