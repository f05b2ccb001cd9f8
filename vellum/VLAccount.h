#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/foundation/NSError.h"

namespace skein {

// Posted when somebody logs in or out, or the account's tokens change.
inline constexpr char VLAccountTokenDidChangeNotification[] = "VLAccountTokenDidChangeNotification";

// A signed-in account. Immutable.
class VLAccount {
 public:
  VLAccount(std::string name, std::optional<std::string> perAppAccountIdentifier)
      : _name(std::move(name)), _perAppAccountIdentifier(std::move(perAppAccountIdentifier)) {}

  const std::string& name() const { return _name; }
  const std::optional<std::string>& perAppAccountIdentifier() const {
    return _perAppAccountIdentifier;
  }

 private:
  const std::string _name;
  const std::optional<std::string> _perAppAccountIdentifier;
};

// The account class's own methods. Any thread.
class VLAccounts {
 public:
  virtual ~VLAccounts() = default;

  // From the first call on, VLAccountTokenDidChangeNotification is posted in this
  // process. Idempotent.
  virtual void startAccountTokenChangeObserverIfNeeded() = 0;

  // currentCachedLoggedInAccountWithError:
  // The account as last heard of; null when nobody is logged in, or with an error when
  // that could not be found out. May ask the daemon the first time.
  virtual std::shared_ptr<const VLAccount> currentCachedLoggedInAccountWithError(
      NSErrorOut error) = 0;
};

}  // namespace skein
