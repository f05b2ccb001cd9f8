#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/Mutex.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/vald/Store.h"
#include "platform/log/Log.h"

namespace skein::vald {

// Who is logged in, kept in the store's settings. Reading: any thread. Changing: one
// thread at a time, which may wait for the disk.
class Accounts {
 public:
  // Reads the account. Where nobody ever logged in or out, logs `firstName` in, so that a
  // fresh drive just works. A setting that cannot be read counts as logged out and is
  // logged; logging in replaces it.
  Accounts(Store& store, std::string firstName, Log& log);

  // nil: nobody is logged in.
  std::optional<LocalAccount> current() const SKEIN_EXCLUDES(_mutex);

  // Null on success; `changed` says whether anything is different now. An account without
  // a per-app identifier may log in: it is the clients who take it for logged out.
  NSErrorPtr logIn(const LocalAccount& account, bool& changed) SKEIN_EXCLUDES(_mutex);
  void logOut(bool& changed) SKEIN_EXCLUDES(_mutex);

 private:
  // True when it differs from what was.
  bool keep(std::optional<LocalAccount> account) SKEIN_EXCLUDES(_mutex);

  Store& _store;
  mutable Mutex _mutex;
  std::optional<LocalAccount> _account SKEIN_GUARDED_BY(_mutex);
};

// The user's login name, or "user" and the number where the system knows none.
std::string loginName();

}  // namespace skein::vald
