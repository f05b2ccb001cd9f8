#include <unistd.h>

#include "linux/vald/RandomToken.h"
#include "tests/vald/SharesRig.h"

namespace skein::vald {
namespace {

using SharesTest = SharesRig;

constexpr char kRefused[] = "CKErrorDomain 10";

TEST_F(SharesTest, AShareIsMadeChangedAndRemovedAndSurvivesARestart) {
  makeFile("Notes.md");
  EXPECT_EQ(codeOf(std::get<2>(copy("Notes.md"))), "VLVellumErrorDomain 20");
  EXPECT_EQ(codeOf(std::get<2>(copy("Gone.md"))), "NSCocoaErrorDomain 4");

  const auto [fresh, _] = this->fresh("Notes.md");
  EXPECT_FALSE(fresh->isKnownToServer);
  EXPECT_EQ(fresh->values.at(CKShareTypeKey), "text/markdown");
  EXPECT_FALSE(isShared("Notes.md"));

  CKShare wanted = *fresh;
  // What a client says of owners and answers does not count.
  wanted.participants = {
      {"ann", CKShareParticipantRole::PrivateUser, CKShareParticipantAcceptanceStatus::Accepted,
       CKShareParticipantPermissionReadWrite},
      {"bob"},
      {"eve", CKShareParticipantRole::Owner}};
  wanted.publicPermission = CKShareParticipantPermissionReadOnly;
  told();
  const auto [saved, error] = save(wanted);
  ASSERT_TRUE(saved) << error->localizedDescription();
  EXPECT_EQ(hinted, id("Notes.md").rawID());
  ASSERT_EQ(saved->participants.size(), 3U);
  EXPECT_EQ(description(saved->participants[0]),
            R"(<CKShareParticipant "me" role 1, status 2, permission 3>)");
  EXPECT_EQ(description(saved->participants[1]),
            R"(<CKShareParticipant "ann" role 3, status 1, permission 3>)");
  EXPECT_EQ(told(), std::set<std::string>{"+Notes.md"});
  EXPECT_TRUE(isShared("Notes.md"));

  const auto answer = [&, url = saved->url](const char* who) {
    return codeOf(std::get<0>(call<NSErrorPtr>(
        [&](auto& to, auto reply) { to.answerInvitation(url, who, true, std::move(reply)); })));
  };
  EXPECT_EQ(answer("ann"), "");
  EXPECT_EQ(answer("me"), "CKErrorDomain 11");  // the owner was not invited
  const auto tokens = [&] {
    const auto [share, base, problem] =
        call<std::optional<std::string>, std::optional<std::string>, NSErrorPtr>(
            [&](auto& to, auto reply) { to.copyShareTokens(url("Notes.md"), std::move(reply)); });
    return std::pair(share, base);
  };
  const auto tokensBefore = tokens();

  reopen();
  EXPECT_TRUE(isShared("Notes.md"));
  EXPECT_EQ(tokens(), tokensBefore);
  const auto kept = std::get<0>(copy("Notes.md"));
  ASSERT_TRUE(kept);
  EXPECT_EQ(kept->publicPermission, CKShareParticipantPermissionReadOnly);
  EXPECT_EQ(kept->url->absoluteString(), saved->url->absoluteString());
  EXPECT_EQ(kept->participants[1].acceptanceStatus, CKShareParticipantAcceptanceStatus::Accepted);

  // A save leaves the answers and takes out who is not named any more.
  CKShare changed = *kept;
  changed.participants.pop_back();
  const auto again = save(changed).first;
  ASSERT_EQ(again->participants.size(), 2U);
  EXPECT_EQ(again->participants[1].acceptanceStatus, CKShareParticipantAcceptanceStatus::Accepted);
  EXPECT_EQ(again->url->absoluteString(), saved->url->absoluteString());

  told();
  EXPECT_FALSE(destroy(*again));
  EXPECT_EQ(told(), std::set<std::string>{"Notes.md"});
  EXPECT_FALSE(isShared("Notes.md"));
  EXPECT_EQ(codeOf(destroy(*again)), "CKErrorDomain 11");
  // The base token stays through the next share, the share token is that share's.
  create("Notes.md");
  EXPECT_EQ(tokens().second, tokensBefore.second);
  EXPECT_NE(tokens().first, tokensBefore.first);
}

TEST_F(SharesTest, WhatASharedFolderHoldsIsSharedByTheFoldersShare) {
  makeFolder("Team/Plans");
  makeFile("Team/Plans/A.txt");
  makeFolder("Other/Sub");
  makeFile("Other/Sub/B.txt");
  told();
  const CKShare share = create("Team", {"ann"});
  EXPECT_EQ(share.values.at(CKShareTypeKey), "folder");
  EXPECT_EQ(told(), (std::set<std::string>{"+Team", "+Plans", "+A.txt"}));
  const auto [covering, folder, error] = copy("Team/Plans/A.txt");
  EXPECT_EQ(covering->url->absoluteString(), share.url->absoluteString());
  EXPECT_EQ(folder, id("Team").asString());
  EXPECT_FALSE(std::get<1>(copy("Team")));
  EXPECT_TRUE(isShared("Team/Plans/A.txt"));
  EXPECT_FALSE(isShared("Other/Sub"));
  EXPECT_EQ(codeOf(fresh("Team/Plans/A.txt").second), kRefused);

  // What a folder holds comes into a share and leaves it with the folder.
  move("Other/Sub", "Team/Sub");
  EXPECT_TRUE(told().contains("+B.txt"));
  move("Team/Sub", "Other/Sub");
  EXPECT_TRUE(told().contains("B.txt"));
  // One that comes into another, later one still has its own share.
  makeFolder("Near");
  makeFile("Near/C.txt");
  create("Near");
  makeFolder("Far");
  create("Far");
  move("Near", "Far/Near");
  EXPECT_EQ(std::get<1>(copy("Far/Near/C.txt")), id("Far/Near").asString());

  const auto options = [&](const std::string& name) {
    return std::get<0>(call<ShareOptions, NSErrorPtr>(
        [&](auto& to, auto reply) { to.shareOptions(id(name).asString(), std::move(reply)); }));
  };
  EXPECT_EQ(options("Team").flags, kHasOwnShare);
  EXPECT_EQ(options("Team").ownFlags, kHasOwnShare);
  EXPECT_FALSE(options("Team").sharedFolder);
  EXPECT_EQ(options("Team/Plans/A.txt").flags, kInSharedFolder);
  EXPECT_EQ(options("Team/Plans/A.txt").ownFlags, 0);
  EXPECT_EQ(options("Team/Plans/A.txt").sharedFolder, "Team");
  EXPECT_EQ(options("Other").flags, 0);
}

TEST_F(SharesTest, WhatCannotBeSharedIsRefusedWithTheReason) {
  makeFolder("Plain/Inner");
  makeFolder("Private/Inner");
  makeFile("Private/Inner/A.txt");
  makeFile("A.txt");
  std::filesystem::create_symlink("A.txt", drive.path + "/Alias");
  settle();
  if (setxattr((drive.path + "/Private").c_str(), kShareableAttribute, "no", 2, 0) != 0) {
    GTEST_SKIP() << "this file system has no extended attributes";
  }
  EXPECT_TRUE(isShareable(id("Plain/Inner")));
  EXPECT_FALSE(isShareable(id("Private")));
  EXPECT_FALSE(isShareable(id("Private/Inner")));
  EXPECT_FALSE(isShareable(id("Alias")));
  EXPECT_FALSE(isShareable(VLFileObjectID::folderOrAliasWithRawID(0x123456789)));
  const auto root = store->itemAtPath(drive.path, false, nullptr);
  EXPECT_EQ(codeOf(std::get<1>(call<CKSharePtr, NSErrorPtr>([&](auto& to, auto reply) {
              to.newShare(NSURL::fileURLWithPath(drive.path), std::move(reply));
            }))),
            kRefused);
  EXPECT_FALSE(isShareable(root->fileObjectID()));

  const std::string app = data.path + "/org.app/Documents";
  std::filesystem::create_directory(app + "/Inner");
  settle();
  EXPECT_FALSE(isShareable(store->itemAtPath(app, true, nullptr)->fileObjectID()));
  EXPECT_TRUE(isShareable(store->itemAtPath(app + "/Inner", true, nullptr)->fileObjectID()));

  const std::string trash = ".Trash-" + std::to_string(getuid()) + "/files";
  makeFolder(trash);
  move("Plain", trash + "/Plain");
  EXPECT_FALSE(isShareable(id(trash + "/Plain/Inner")));

  const auto refused = fresh("Private/Inner/A.txt").second;
  EXPECT_EQ(codeOf(refused), kRefused);
  EXPECT_NE(refused->localizedDescription().find(drive.path + "/Private"), std::string::npos);
  EXPECT_EQ(codeOf(std::get<1>(call<NSURLPtr, NSErrorPtr>([&](auto& to, auto reply) {
              to.copyShareURL(url("Private/Inner/A.txt"), std::move(reply));
            }))),
            kRefused);
}

TEST_F(SharesTest, ASaveThatCannotBeDoneChangesNothing) {
  makeFile("A.txt");
  const CKShare fresh = *this->fresh("A.txt").first;
  CKShare wrong = fresh;
  wrong.participants = {{"ann"}, {"ann"}, {""}};
  const auto partial = save(wrong).second;
  EXPECT_EQ(codeOf(partial), "CKErrorDomain 2");
  EXPECT_TRUE(partial->userInfo().contains(std::string(CKPartialErrorsByItemIDKeyPrefix) + "ann"));
  wrong = fresh;
  wrong.publicPermission = 17;
  EXPECT_EQ(codeOf(save(wrong).second), "VLVellumErrorDomain 15");
  wrong = fresh;
  wrong.values[CKShareTypeKey] = "folder";
  EXPECT_EQ(codeOf(save(wrong).second), "VLVellumErrorDomain 15");
  EXPECT_FALSE(isShared("A.txt"));
  makeFolder("Team");
  wrong = *this->fresh("Team").first;
  wrong.values.erase(CKShareTypeKey);
  EXPECT_EQ(codeOf(save(wrong).second), "VLVellumErrorDomain 15");
  EXPECT_FALSE(isShared("Team"));

  const CKShare first = create("A.txt");
  EXPECT_EQ(codeOf(save(fresh).second), "CKErrorDomain 14");  // shared meanwhile
  EXPECT_FALSE(destroy(first));
  EXPECT_EQ(codeOf(save(first).second), "CKErrorDomain 11");  // removed meanwhile

  bool changed = false;
  accounts->logOut(changed);
  EXPECT_EQ(codeOf(save(fresh).second), "VLVellumErrorDomain 2");
}

TEST_F(SharesTest, ACallThatIsCancelledBeforeItsTurnDoesNothing) {
  makeFile("A.txt");
  const CKShare share = *fresh("A.txt").first;
  const auto [saved, error] = call<CKSharePtr, NSErrorPtr>([&](auto& to, auto reply) {
    const auto progress = to.saveShare(share, std::move(reply));
    progress->cancel();
    progress->cancel();
  });
  EXPECT_FALSE(saved);
  EXPECT_EQ(codeOf(error), "NSCocoaErrorDomain 3072");
  EXPECT_EQ(codeOf(std::get<2>(copy("A.txt"))), "VLVellumErrorDomain 20");
}

TEST_F(SharesTest, WhatACrashKeptFromBeingToldIsToldAtTheNextStart) {
  makeFile("A.txt");
  ShareRecord record;
  record.item = id("A.txt");
  record.share.url = drawShareURL();
  record.shareToken = randomToken();
  ASSERT_FALSE(records->put(record));
  told();
  reopen();
  EXPECT_TRUE(told().contains("+A.txt"));
  EXPECT_TRUE(records->untold()->empty());
}

TEST_F(SharesTest, BothOwnersHaveItems) {
  makeFolder("From ann/Deep");
  makeFile("From ann/Deep/A.txt");
  makeFile("Mine.txt");
  EXPECT_EQ(codeOf(attach("Mine.txt", "ann")), "VLVellumErrorDomain 15");
  EXPECT_EQ(codeOf(attach("From ann", CKCurrentUserDefaultName)), "VLVellumErrorDomain 15");
  const CKShare inner = create("From ann/Deep/A.txt");
  EXPECT_EQ(codeOf(attach("From ann", "ann")), kRefused);
  EXPECT_FALSE(destroy(inner));
  ASSERT_FALSE(attach("From ann", "ann"));
  EXPECT_EQ(codeOf(attach("From ann/Deep", "bob")), kRefused);

  reopen();
  EXPECT_TRUE(isShared("From ann/Deep/A.txt"));
  EXPECT_FALSE(isShared("Mine.txt"));
  EXPECT_EQ((*shares->attachedZoneFinder())(id("From ann/Deep/A.txt"))->ownerName, "ann");
  EXPECT_FALSE((*shares->attachedZoneFinder())(id("Mine.txt")));
  const auto [zones, _] = call<std::vector<AttachedZone>, NSErrorPtr>(
      [](auto& to, auto reply) { to.attachedZones(std::move(reply)); });
  ASSERT_EQ(zones.size(), 1U);
  EXPECT_EQ(zones[0].folder->path(), url("From ann")->path());
  EXPECT_EQ(zones[0].permission, CKShareParticipantPermissionReadOnly);

  // It is ann's to share: nobody here does, changes or ends it.
  EXPECT_FALSE(isShareable(id("From ann")));
  EXPECT_FALSE(isShareable(id("From ann/Deep")));
  const auto [share, folder, error] = copy("From ann/Deep/A.txt");
  EXPECT_EQ(folder, id("From ann").asString());
  EXPECT_EQ(share->participants[0].name, "ann");
  EXPECT_EQ(codeOf(save(*share).second), kRefused);
  EXPECT_EQ(codeOf(destroy(*share)), kRefused);

  ASSERT_FALSE(detach("From ann"));
  EXPECT_FALSE(isShared("From ann/Deep/A.txt"));
  EXPECT_FALSE((*shares->attachedZoneFinder())(id("From ann")));
  EXPECT_EQ(codeOf(detach("From ann")), "VLVellumErrorDomain 15");
}

TEST_F(SharesTest, RefreshingBringsTheStoreInLineWithTheCloud) {
  makeFolder("Team");
  const std::string team = id("Team").asString();
  const auto refresh = [&] {
    return std::get<0>(call<NSErrorPtr>(
        [&](auto& to, auto reply) { to.refreshSharingState(team, std::move(reply)); }));
  };
  create("Team");
  const auto record = *records->share(id("Team"));
  ASSERT_FALSE(records->remove(id("Team")));
  EXPECT_TRUE(isShared("Team"));
  EXPECT_FALSE(refresh());
  EXPECT_FALSE(isShared("Team"));
  ASSERT_FALSE(records->put(*record));
  EXPECT_FALSE(refresh());
  EXPECT_TRUE(isShared("Team"));
  ASSERT_FALSE(records->remove(id("Team")));
  EXPECT_FALSE(refresh());

  // What is away for a moment keeps its share.
  create("Team");
  const std::string away = drive.path + "-away";
  std::filesystem::rename(drive.path + "/Team", away);
  settle();
  EXPECT_EQ(codeOf(refresh()), "NSCocoaErrorDomain 4");
  std::filesystem::rename(away, drive.path + "/Team");
  settle();
  EXPECT_EQ(id("Team").asString(), team);
  EXPECT_FALSE(refresh());
  EXPECT_TRUE(isShared("Team"));
}

}  // namespace
}  // namespace skein::vald
