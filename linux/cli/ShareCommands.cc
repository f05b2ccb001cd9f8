// skein share info|show|create|save|url|remove
#include <algorithm>
#include <optional>
#include <vector>

#include "linux/cli/ExitCodes.h"
#include "linux/cli/ServiceSession.h"

namespace skein::cli {
namespace {

struct ShareOptions {
  std::string item;
  std::vector<std::string> with;     // NAME or NAME:read|write
  std::vector<std::string> without;  // NAME
  std::string publicPermission;      // none, read or write; empty: as it is
  std::string title;
  bool json = false;
};

struct PermissionName {
  CKShareParticipantPermission permission;
  std::string_view name;
};
constexpr PermissionName kPermissions[] = {
    {CKShareParticipantPermissionNone, "none"},
    {CKShareParticipantPermissionReadOnly, "read"},
    {CKShareParticipantPermissionReadWrite, "write"},
};

std::string_view nameOf(CKShareParticipantPermission permission) {
  for (const auto& known : kPermissions) {
    if (known.permission == permission) return known.name;
  }
  return "unknown";
}

std::optional<CKShareParticipantPermission> permissionOf(std::string_view name) {
  for (const auto& known : kPermissions) {
    if (known.name == name) return known.permission;
  }
  return std::nullopt;
}

std::string_view nameOf(CKShareParticipantRole role) {
  switch (role) {
    case CKShareParticipantRole::Owner: return "owner";
    case CKShareParticipantRole::PrivateUser: return "invited";
    case CKShareParticipantRole::PublicUser: return "public";
    case CKShareParticipantRole::Unknown: break;
  }
  return "unknown";
}

std::string_view nameOf(CKShareParticipantAcceptanceStatus status) {
  switch (status) {
    case CKShareParticipantAcceptanceStatus::Pending: return "pending";
    case CKShareParticipantAcceptanceStatus::Accepted: return "accepted";
    case CKShareParticipantAcceptanceStatus::Removed: return "removed";
    case CKShareParticipantAcceptanceStatus::Unknown: break;
  }
  return "unknown";
}

std::string valueOf(const CKShare& share, const char* key) {
  const std::string* value = share.objectForKey(key);
  return value != nullptr ? *value : "";
}

std::string jsonOf(const CKShare& share) {
  std::string text = std::string("{\"shared\":") + (share.isKnownToServer ? "true" : "false") +
                     ",\"type\":" + jsonString(valueOf(share, CKShareTypeKey)) +
                     ",\"title\":" + jsonString(valueOf(share, CKShareTitleKey)) +
                     ",\"public\":" + jsonString(nameOf(share.publicPermission)) +
                     ",\"url\":" + (share.url ? jsonString(share.url->absoluteString()) : "null") +
                     ",\"participants\":[";
  bool first = true;
  for (const CKShareParticipant& one : share.participants) {
    if (!std::exchange(first, false)) text += ',';
    text += "{\"name\":" + jsonString(one.name) + ",\"role\":" + jsonString(nameOf(one.role)) +
            ",\"status\":" + jsonString(nameOf(one.acceptanceStatus)) +
            ",\"permission\":" + jsonString(nameOf(one.permission)) + '}';
  }
  return text + "]}\n";
}

void writeShare(Output& output, const CKShare& share, bool json) {
  if (json) {
    output.write(jsonOf(share));
    return;
  }
  if (!share.isKnownToServer) {
    output.write("not shared\n");
    return;
  }
  output.writeField("type", valueOf(share, CKShareTypeKey));
  if (const std::string title = valueOf(share, CKShareTitleKey); !title.empty()) {
    output.writeField("title", title);
  }
  if (share.url) output.writeField("url", share.url->absoluteString());
  output.writeField("public", nameOf(share.publicPermission));
  for (const CKShareParticipant& one : share.participants) {
    output.write(one.role == CKShareParticipantRole::Owner ? "owner       " : "with        ");
    output.writeName(one.name);
    if (one.role != CKShareParticipantRole::Owner) {
      output.write(", " + std::string(nameOf(one.permission)) + ", " +
                   std::string(nameOf(one.acceptanceStatus)));
    }
    output.write("\n");
  }
}

// Runs `request(sharing, output)`, which answers an error; complains about it.
template <class Request>
int withSharing(ServiceSession& session, const ShareOptions& options, Request request) {
  NSErrorPtr error;
  const auto sharing = session.services.sharing(options.item, &error);
  if (!sharing) return complainAbout(error);
  Output output;
  error = request(sharing, output);
  output.flush();
  return error ? complainAbout(error) : kSuccess;
}

using Sharing = ServiceHandle<VLSharingServiceV1>;

std::tuple<CKSharePtr, NSErrorPtr> fetchShare(ServiceSession& session, const Sharing& sharing) {
  return session.ask<CKSharePtr>(
      [&](auto reply) { return sharing->fetchShareWithCompletion(std::move(reply)); });
}

int runInfo(ServiceSession& session, const ShareOptions& options) {
  NSErrorPtr error;
  const auto names = session.services.serviceNames(options.item, &error);
  if (error) return complainAbout(error);
  bool shared = false;
  if (std::find(names.begin(), names.end(), VLSharingServiceName) != names.end()) {
    const auto sharing = session.services.sharing(options.item, &error);
    if (!sharing) return complainAbout(error);
    std::tie(shared, std::ignore, error) = session.ask<bool, NSFileProviderItemPtr>(
        [&](auto reply) { sharing->fetchSharingInfo(std::move(reply)); });
    if (error) return complainAbout(error);
  }
  Output output;
  if (options.json) {
    std::string text =
        std::string("{\"shared\":") + (shared ? "true" : "false") + ",\"services\":[";
    for (const std::string& name : names) {
      text += (&name != &names.front() ? "," : "") + jsonString(name);
    }
    output.write(text + "]}\n");
    return kSuccess;
  }
  output.writeField("shared", shared ? "yes" : "no");
  for (const std::string& name : names) output.writeField("service", name);
  if (names.empty()) output.writeField("service", "none: this cannot be shared");
  return kSuccess;
}

int runShow(ServiceSession& session, const ShareOptions& options) {
  return withSharing(session, options, [&](const Sharing& sharing, Output& output) {
    const auto [share, error] = fetchShare(session, sharing);
    if (share && !error) writeShare(output, *share, options.json);
    return error;
  });
}

// The share as the options want it. False when they make no sense; then it has complained.
bool change(CKShare& share, const ShareOptions& options) {
  if (!options.publicPermission.empty()) {
    share.publicPermission = *permissionOf(options.publicPermission);
  }
  if (!options.title.empty()) share.values[CKShareTitleKey] = options.title;
  auto& people = share.participants;
  const auto find = [&](const std::string& name) {
    return std::find_if(people.begin(), people.end(),
                        [&](const CKShareParticipant& one) { return one.name == name; });
  };
  for (const std::string& name : options.without) {
    const auto found = find(name);
    if (found == people.end() || found->role == CKShareParticipantRole::Owner) {
      complain(name + " was not invited; see who is with: skein share show " + options.item);
      return false;
    }
    people.erase(found);
  }
  for (const std::string& one : options.with) {
    const auto colon = one.rfind(':');
    const auto permission = colon == std::string::npos
                                ? std::optional(CKShareParticipantPermissionReadOnly)
                                : permissionOf(std::string_view(one).substr(colon + 1));
    const std::string name = one.substr(0, colon);
    if (!permission || name.empty()) {
      complain("\"" + one + "\" is no NAME, NAME:read or NAME:write");
      return false;
    }
    auto found = find(name);
    if (found == people.end()) {
      CKShareParticipant invited;
      invited.name = name;
      found = people.insert(people.end(), invited);
    }
    found->permission = *permission;
  }
  return true;
}

int runSave(ServiceSession& session, const ShareOptions& options, bool isNew) {
  std::optional<ExitCode> refused;
  const int code =
      withSharing(session, options, [&](const Sharing& sharing, Output& output) -> NSErrorPtr {
        const auto [share, error] = fetchShare(session, sharing);
        if (error) return error;
        if (share->isKnownToServer == isNew) {
          complain(isNew ? "this is shared already; change the share with: skein share save " +
                               options.item
                         : "this is not shared; share it with: skein share create " + options.item);
          refused = isNew ? kCollision : kFailure;
          return nullptr;
        }
        CKShare wanted = *share;
        if (!change(wanted, options)) {
          refused = kUsage;
          return nullptr;
        }
        const auto [saved, problem] = session.ask<CKSharePtr>([&](auto reply) {
          return sharing->saveShare(std::make_shared<const CKShare>(wanted), std::move(reply));
        });
        if (saved && !problem) writeShare(output, *saved, options.json);
        return problem;
      });
  return refused ? *refused : code;
}

int runURL(ServiceSession& session, const ShareOptions& options) {
  return withSharing(session, options, [&](const Sharing& sharing, Output& output) {
    const auto [url, error] = session.ask<NSURLPtr>(
        [&](auto reply) { return sharing->fetchShareURLWithCompletion(std::move(reply)); });
    if (!error && url) {
      const std::string address = url->absoluteString();
      output.write(options.json ? "{\"url\":" + jsonString(address) + "}\n" : address + '\n');
    }
    return error;
  });
}

int runRemove(ServiceSession& session, const ShareOptions& options) {
  return withSharing(session, options, [&](const Sharing& sharing, Output& output) {
    const auto [error] =
        session.ask<>([&](auto reply) { return sharing->unshareWithCompletion(std::move(reply)); });
    if (!error && options.json) output.write("{\"shared\":false}\n");
    return error;
  });
}

}  // namespace

void addShareCommand(CLI::App& app, Invocation& invocation) {
  auto* share = app.add_subcommand("share", "Share an item: who has access, and by which URL");
  share->require_subcommand(1);
  share->fallthrough();
  share->footer("Example: skein share create /letter.txt --with kim:write");

  const auto add = [&](const char* name, const char* purpose, const char* example, auto run) {
    auto options = std::make_shared<ShareOptions>();
    auto* command = share->add_subcommand(name, purpose);
    command->fallthrough();
    command->add_option("ITEM", options->item, "A path from the drive's root, or an identifier")
        ->required();
    command->add_flag("--json", options->json, "One JSON object");
    command->footer(std::string("Example: skein share ") + example);
    command->callback([&invocation, options, run] {
      invocation.run = [&invocation, options, run] {
        return withServices(invocation,
                            [&](ServiceSession& session) { return run(session, *options); });
      };
    });
    return std::pair(command, options);
  };
  add("info", "Whether an item is shared, and which services it offers", "info /letter.txt",
      runInfo);
  add("show", "The share that covers an item", "show /letter.txt", runShow);
  add("url", "The URL by which people come to an item; shares it with nobody if need be",
      "url /letter.txt", runURL);
  add("remove", "End the sharing of an item", "remove /letter.txt", runRemove);
  const auto addChanging = [&](const char* name, const char* purpose, const char* example,
                               bool isNew) {
    const auto [command, options] =
        add(name, purpose, example, [isNew](ServiceSession& session, const ShareOptions& chosen) {
          return runSave(session, chosen, isNew);
        });
    command->add_option("--with", options->with, "Invite NAME, NAME:read or NAME:write");
    if (!isNew) command->add_option("--without", options->without, "No longer invite NAME");
    command->add_option("--public", options->publicPermission, "What anybody with the URL may do")
        ->check(CLI::IsMember({"none", "read", "write"}));
    command->add_option("--title", options->title, "What the invited see");
  };
  addChanging("create", "Share an item that is not shared yet",
              "create /letter.txt --with kim:write --public read", true);
  addChanging("save", "Change the share of an item", "save /letter.txt --without kim", false);
}

}  // namespace skein::cli
