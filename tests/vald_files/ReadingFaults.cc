#include "tests/vald_files/ReadingFaults.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

namespace skein::vald {
namespace {

struct Plan {
  std::string part;
  int error;
  std::atomic<int> spared;
  std::atomic<int> met{0};

  Plan(std::string what, int number, int first)
      : part(std::move(what)), error(number), spared(first) {}
};

std::array<std::atomic<Plan*>, 8> plans{};

// Calls that are under way may still look at one that has ended.
Plan* keep(std::unique_ptr<Plan> plan) {
  static std::mutex mutex;
  static std::vector<std::unique_ptr<Plan>> all;
  const std::lock_guard lock(mutex);
  all.push_back(std::move(plan));
  return all.back().get();
}

std::atomic<Plan*>& planOf(ReadingCall call) { return plans.at(static_cast<std::size_t>(call)); }

std::string pathOf(int file, const char* name) {
  std::string path;
  if (name == nullptr || *name != '/') {
    char link[32];
    std::snprintf(link, sizeof link, "/proc/self/fd/%d", file);
    path.resize(PATH_MAX);
    const ssize_t length = ::readlink(link, path.data(), path.size());
    path.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
    if (name != nullptr && *name != '\0') path += '/';
  }
  return name == nullptr ? path : path + name;
}

// What the call has to answer; 0: what the system does.
int faultOf(ReadingCall call, int file, const char* name) {
  Plan* const plan = planOf(call).load();
  if (plan == nullptr) return 0;
  const int before = errno;
  const bool concerns = pathOf(file, name).find(plan->part) != std::string::npos;
  errno = before;
  if (!concerns || plan->spared.fetch_sub(1) > 0) return 0;
  ++plan->met;
  return plan->error;
}

bool fails(ReadingCall call, int file, const char* name = nullptr) {
  const int fault = faultOf(call, file, name);
  if (fault != 0) errno = fault;
  return fault != 0;
}

template <class Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

}  // namespace

ReadingFault::ReadingFault(ReadingCall call, std::string part, int error, int spared)
    : _call(call) {
  planOf(call) = keep(std::make_unique<Plan>(std::move(part), error, spared));
}

ReadingFault::~ReadingFault() { planOf(_call) = nullptr; }

int ReadingFault::met() const { return planOf(_call).load()->met; }

}  // namespace skein::vald

// In place of the system's.
extern "C" {

using skein::vald::fails;
using skein::vald::next;
using Call = skein::vald::ReadingCall;

int open(const char* path, int flags, ...) {
  static auto* const real = next<int(const char*, int, ...)>("open");
  va_list rest;
  va_start(rest, flags);
  const auto mode = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(rest, mode_t) : mode_t{0};
  va_end(rest);
  return fails(Call::Open, AT_FDCWD, path) ? -1 : real(path, flags, mode);
}

int statx(int at, const char* name, int flags, unsigned mask, struct statx* status) noexcept {
  static auto* const real = next<int(int, const char*, int, unsigned, struct statx*)>("statx");
  return fails(Call::Statx, at, name) ? -1 : real(at, name, flags, mask, status);
}

int fstatat(int at, const char* name, struct stat* status, int flags) noexcept {
  static auto* const real = next<int(int, const char*, struct stat*, int)>("fstatat");
  return fails(Call::Fstatat, at, name) ? -1 : real(at, name, status, flags);
}

ssize_t getdents64(int folder, void* buffer, size_t size) noexcept {
  static auto* const real = next<ssize_t(int, void*, size_t)>("getdents64");
  return fails(Call::Getdents, folder) ? -1 : real(folder, buffer, size);
}

dirent* readdir(DIR* folder) {
  static auto* const real = next<dirent*(DIR*)>("readdir");
  return fails(Call::Readdir, ::dirfd(folder)) ? nullptr : real(folder);
}

ssize_t pread(int file, void* bytes, size_t size, off_t offset) {
  static auto* const real = next<ssize_t(int, void*, size_t, off_t)>("pread");
  return fails(Call::Pread, file) ? -1 : real(file, bytes, size, offset);
}

ssize_t copy_file_range(int from, off64_t* fromOffset, int to, off64_t* toOffset, size_t size,
                        unsigned flags) {
  static auto* const real =
      next<ssize_t(int, off64_t*, int, off64_t*, size_t, unsigned)>("copy_file_range");
  if (fails(Call::CopyFileRange, from)) return -1;
  return real(from, fromOffset, to, toOffset, size, flags);
}

ssize_t write(int file, const void* bytes, size_t size) {
  static auto* const real = next<ssize_t(int, const void*, size_t)>("write");
  const int most = skein::vald::faultOf(Call::Write, file, nullptr);
  return real(file, bytes,
              most > 0 && size > static_cast<size_t>(most) ? static_cast<size_t>(most) : size);
}

}  // extern "C"
