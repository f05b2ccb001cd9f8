// Shares a document of a drive with somebody, shows what its share says, and prints the
// URL to send:
//
//   share_document ~/Documents /letter.txt kim
//
// A program needs one header for it and links skein_linux_client.
#include <cstdio>
#include <string>

#include "linux/client/SkeinServices.h"
#include "platform/log/Description.h"

using namespace skein;

namespace {

int fail(const std::string& what, const NSErrorPtr& error) {
  std::fprintf(stderr, "share_document: %s: %s\n", what.c_str(), description(error).c_str());
  return 1;
}

const char* permissionName(CKShareParticipantPermission permission) {
  if (permission == CKShareParticipantPermissionReadWrite) return "may change it";
  return permission == CKShareParticipantPermissionReadOnly ? "may read it" : "has no access";
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 4) {
    std::fputs("usage: share_document STORE ITEM NAME\n", stderr);
    return 2;
  }
  const std::string item = argv[2];
  NSErrorPtr error;

  // 1. The drive, and what the item offers.
  const auto services = SkeinServices::open(argv[1], &error);
  if (!services) return fail(argv[1], error);
  for (const std::string& name : services->serviceNames(item, &error)) {
    std::printf("offers %s\n", name.c_str());
  }
  if (error) return fail(item, error);

  // 2. A connection to its sharing service; it is closed when it goes out of scope.
  const auto sharing = services->sharing(item, &error);
  if (!sharing) return fail(item, error);

  // 3. The share as it is, or one to begin with.
  const auto [share, fetchError] = awaitReply<CKSharePtr>(
      [&](auto reply) { return sharing->fetchShareWithCompletion(std::move(reply)); });
  if (fetchError) return fail("its share", fetchError);

  // 4. The same with one more participant.
  CKShare changed = *share;
  CKShareParticipant participant;
  participant.name = argv[3];
  participant.permission = CKShareParticipantPermissionReadWrite;
  changed.participants.push_back(participant);
  const auto [saved, saveError] = awaitReply<CKSharePtr>([&](auto reply) {
    return sharing->saveShare(std::make_shared<const CKShare>(changed), std::move(reply));
  });
  if (saveError) return fail("saving its share", saveError);

  for (const CKShareParticipant& one : saved->participants) {
    std::printf("%s %s\n", one.name.c_str(), permissionName(one.permission));
  }

  // 5. The URL by which people come to it.
  const auto [url, urlError] = awaitReply<NSURLPtr>(
      [&](auto reply) { return sharing->fetchShareURLWithCompletion(std::move(reply)); });
  if (urlError) return fail("its URL", urlError);
  std::printf("%s\n", url->absoluteString().c_str());
  return 0;
}
