// skein collab version|token|latest|refresh|folder-state
#include "linux/cli/ExitCodes.h"
#include "linux/cli/ServiceSession.h"

namespace skein::cli {
namespace {

using Collaboration = ServiceHandle<VLFileProviderQuireCollaboration>;
using Text = VLFileProviderQuireCollaboration::Text;

std::string jsonOrNull(const Text& text) { return text ? jsonString(*text) : "null"; }

NSErrorPtr runVersion(ServiceSession& session, const Collaboration& service, Output& output,
                      bool json) {
  const auto [version, bits, error] = session.ask<std::uint64_t, std::uint64_t>([&](auto reply) {
    service->fetchVersionAndCapabilitiesWithCompletionHandler(std::move(reply));
  });
  if (error) return error;
  const auto [provider, problem] = session.ask<Text>([&](auto reply) {
    service->fetchFileProviderIdentifierWithCompletionHandler(std::move(reply));
  });
  if (problem) return problem;
  if (json) {
    output.write("{\"version\":" + std::to_string(version) + ",\"capabilities\":" +
                 std::to_string(bits) + ",\"provider\":" + jsonOrNull(provider) + "}\n");
  } else {
    output.write("version " + std::to_string(version) + ", capabilities " + std::to_string(bits) +
                 ", provider " + provider.value_or("-") + "\n");
  }
  return nullptr;
}

NSErrorPtr runToken(ServiceSession& session, const Collaboration& service, Output& output,
                    bool json) {
  const auto [provider, base, share, expiry, error] =
      session.ask<Text, Text, Text, std::optional<NSDate>>([&](auto reply) {
        return service->fetchCollaborationTokenWithCompletionHandler(std::move(reply));
      });
  if (error) return error;
  const bool ends = expiry && *expiry != NSDateDistantFuture();
  if (json) {
    output.write("{\"provider\":" + jsonOrNull(provider) + ",\"base\":" + jsonOrNull(base) +
                 ",\"share\":" + jsonOrNull(share) +
                 ",\"expires\":" + (ends ? jsonString(isoDate(*expiry)) : "null") + "}\n");
  } else {
    output.write("provider " + provider.value_or("-") + "\nbase     " + base.value_or("-") +
                 "\nshare    " + share.value_or("-") + "\nexpires  " +
                 (ends ? localDate(expiry) : "never") + "\n");
  }
  return nullptr;
}

NSErrorPtr runLatest(ServiceSession& session, const Collaboration& service, Output& output,
                     bool json) {
  const auto [error] = session.ask<>([&](auto reply) {
    return service->fetchLatestRevisionWithCompletionHandler(std::move(reply));
  });
  if (!error && json) output.write("{\"latest\":true}\n");
  return error;
}

NSErrorPtr runRefresh(ServiceSession& session, const Collaboration& service, Output& output,
                      bool json) {
  const auto [error] = session.ask<>([&](auto reply) {
    return service->refreshSharingStateWithCompletionHandler(std::move(reply));
  });
  if (!error && json) output.write("{\"refreshed\":true}\n");
  return error;
}

NSErrorPtr runFolderState(ServiceSession& session, const Collaboration& service, Output& output,
                          bool json) {
  const auto [shared, folder, error] = session.ask<bool, Text>([&](auto reply) {
    return service->fetchSharedFolderInfoWithCompletionHandler(std::move(reply));
  });
  if (error) return error;
  if (json) {
    output.write(std::string("{\"inSharedFolder\":") + (shared ? "true" : "false") +
                 ",\"folder\":" + jsonOrNull(folder) + "}\n");
  } else if (shared) {
    output.write("in a shared folder: ");
    output.writeName(folder.value_or("-"));
    output.write("\n");
  } else {
    output.write("in no shared folder\n");
  }
  return nullptr;
}

struct CollabOptions {
  std::string item;
  bool json = false;
};

struct CollabCommand {
  const char* name;
  const char* purpose;
  NSErrorPtr (*run)(ServiceSession&, const Collaboration&, Output&, bool);
};
constexpr CollabCommand kCommands[] = {
    {"version", "Which version of the service this is, and what it can do", runVersion},
    {"token", "The tokens that collaborators know a shared document by", runToken},
    {"latest", "Fetch the latest revision of a document's contents", runLatest},
    {"refresh", "Ask the cloud anew how a document is shared", runRefresh},
    {"folder-state", "Whether a folder above shares a document", runFolderState},
};

}  // namespace

void addCollabCommand(CLI::App& app, Invocation& invocation) {
  auto* collab = app.add_subcommand("collab", "Work together on a document");
  collab->require_subcommand(1);
  collab->fallthrough();
  collab->footer("Example: skein collab token /letter.txt");
  for (const CollabCommand& one : kCommands) {
    auto options = std::make_shared<CollabOptions>();
    auto* command = collab->add_subcommand(one.name, one.purpose);
    command->fallthrough();
    command->add_option("ITEM", options->item, "A path from the drive's root, or an identifier")
        ->required();
    command->add_flag("--json", options->json, "One JSON object");
    command->footer(std::string("Example: skein collab ") + one.name + " /letter.txt");
    command->callback([&invocation, options, run = one.run] {
      invocation.run = [&invocation, options, run] {
        return withServices(invocation, [&](ServiceSession& session) -> int {
          NSErrorPtr error;
          const auto service = session.services.collaboration(options->item, &error);
          if (!service) return complainAbout(error);
          Output output;
          error = run(session, service, output, options->json);
          output.flush();
          return error ? complainAbout(error) : kSuccess;
        });
      };
    });
  }
}

}  // namespace skein::cli
