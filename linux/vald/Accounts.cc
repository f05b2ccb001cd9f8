#include "linux/vald/Accounts.h"

#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <string_view>
#include <utility>

#include "linux/vald/RandomToken.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr char kSetting[] = "account";
constexpr std::string_view kLoggedOut = "out";
constexpr std::string_view kLoggedIn = "in";
constexpr std::size_t kLongestText = 255;

// Control characters, the line end among them, never get in: a line end separates the
// setting's fields, and names are printed.
bool isPlainText(std::string_view text) {
  return !text.empty() && text.size() <= kLongestText &&
         std::none_of(text.begin(), text.end(), [](char c) {
           const auto byte = static_cast<unsigned char>(c);
           return byte < 0x20 || byte == 0x7F;
         });
}

// "out", or "in", the name, and the identifier when there is one; a line each.
std::string encoded(const std::optional<LocalAccount>& account) {
  if (!account) return std::string(kLoggedOut);
  std::string text = std::string(kLoggedIn) + '\n' + account->name;
  if (account->perAppAccountIdentifier) text += '\n' + *account->perAppAccountIdentifier;
  return text;
}

// False when `text` is none that encoded() gives.
bool decode(std::string_view text, std::optional<LocalAccount>& account) {
  account.reset();
  if (text == kLoggedOut) return true;
  const std::string_view prefix = text.substr(0, kLoggedIn.size() + 1);
  if (prefix.size() <= kLoggedIn.size() || !prefix.starts_with(kLoggedIn) ||
      prefix.back() != '\n') {
    return false;
  }
  text.remove_prefix(prefix.size());
  const std::size_t end = text.find('\n');
  LocalAccount found{std::string(text.substr(0, end)), std::nullopt};
  if (end != std::string_view::npos) found.perAppAccountIdentifier = text.substr(end + 1);
  if (!isPlainText(found.name)) return false;
  if (found.perAppAccountIdentifier && !isPlainText(*found.perAppAccountIdentifier)) return false;
  account = std::move(found);
  return true;
}

}  // namespace

Accounts::Accounts(Store& store, std::string firstName, Log& log) : _store(store) {
  const std::optional<std::string> setting = store.setting(kSetting);
  std::optional<LocalAccount> account;
  if (!setting) {
    account = LocalAccount{std::move(firstName), randomToken()};
    store.setSetting(kSetting, encoded(account));
  } else if (!decode(*setting, account)) {
    VL_ERROR(log, "[ERROR] the kept account cannot be read, nobody is logged in: %@", *setting);
  }
  MutexLock lock(_mutex);
  _account = std::move(account);
}

std::optional<LocalAccount> Accounts::current() const {
  MutexLock lock(_mutex);
  return _account;
}

NSErrorPtr Accounts::logIn(const LocalAccount& account, bool& changed) {
  changed = false;
  if (!isPlainText(account.name)) return vlc_errorInvalidParameter("name", account.name);
  const auto& identifier = account.perAppAccountIdentifier;
  if (identifier && !isPlainText(*identifier)) {
    return vlc_errorInvalidParameter("perAppAccountIdentifier", *identifier);
  }
  changed = keep(account);
  return nullptr;
}

void Accounts::logOut(bool& changed) { changed = keep(std::nullopt); }

bool Accounts::keep(std::optional<LocalAccount> account) {
  // Kept before it is told: what a client was told is true after a crash.
  _store.setSetting(kSetting, encoded(account));
  MutexLock lock(_mutex);
  if (_account == account) return false;
  _account = std::move(account);
  return true;
}

std::string loginName() {
  std::array<char, 4096> buffer{};
  passwd entry{};
  passwd* found = nullptr;
  getpwuid_r(getuid(), &entry, buffer.data(), buffer.size(), &found);
  if (found != nullptr && isPlainText(found->pw_name)) return found->pw_name;
  return "user" + std::to_string(getuid());
}

}  // namespace skein::vald
