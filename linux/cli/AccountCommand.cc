// skein account
#include <cstdlib>
#include <utility>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"

namespace skein::cli {
namespace {

struct LoginOptions {
  std::string name;
  bool noAppID = false;
};

int showStatus(HostService& host) {
  const auto [account, error] =
      await<std::optional<LocalAccount>>([&](auto reply) { host.account(std::move(reply)); });
  if (error) return complainAbout(error);
  Output output;
  if (!account) {
    output.write("Nobody is logged in. Log in with: skein account login\n");
    return kNotAuthenticated;
  }
  output.write("Logged in as ");
  output.writeName(account->name);
  if (account->perAppAccountIdentifier) {
    output.write(", identifier ");
    output.writeName(*account->perAppAccountIdentifier);
    output.write(".\n");
    return kSuccess;
  }
  output.write(", without an identifier for this app; that counts as logged out.\n");
  return kNotAuthenticated;
}

int logIn(HostService& host, const LoginOptions& options) {
  LocalAccount account{options.name, std::nullopt};
  if (account.name.empty()) {
    const char* user = std::getenv("USER");
    account.name = user != nullptr && *user != '\0' ? user : "me";
  }
  if (!options.noAppID) account.perAppAccountIdentifier = account.name + "@skein";
  const auto [error] = await<>([&](auto reply) { host.logIn(account, std::move(reply)); });
  return error ? complainAbout(error) : kSuccess;
}

int logOut(HostService& host) {
  const auto [error] = await<>([&](auto reply) { host.logOut(std::move(reply)); });
  return error ? complainAbout(error) : kSuccess;
}

}  // namespace

void addAccountCommand(CLI::App& app, Invocation& invocation) {
  auto* account = app.add_subcommand("account", "Show who is logged in; log in and out");
  account->require_subcommand(1);
  account->fallthrough();
  account->footer("Example: skein account login kim");

  auto* status = account->add_subcommand("status", "Show who is logged in (exit code 4: nobody)");
  status->fallthrough();
  status->footer("Example: skein account status");
  status->callback([&invocation] {
    invocation.run = [&invocation] { return withSession(invocation, showStatus); };
  });

  auto options = std::make_shared<LoginOptions>();
  auto* login = account->add_subcommand("login", "Log in, in place of whoever is");
  login->fallthrough();
  login->add_option("NAME", options->name, "The account's name (yours if not given)");
  login->add_flag("--no-app-id", options->noAppID, "An account without an identifier for this app");
  login->footer("Example: skein account login kim");
  login->callback([&invocation, options] {
    invocation.run = [&invocation, options] {
      return withSession(invocation, [&](HostService& host) { return logIn(host, *options); });
    };
  });

  auto* logout = account->add_subcommand("logout", "Log out");
  logout->fallthrough();
  logout->footer("Example: skein account logout");
  logout->callback([&invocation] {
    invocation.run = [&invocation] { return withSession(invocation, logOut); };
  });
}

}  // namespace skein::cli
