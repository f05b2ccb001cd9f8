// Where an app's documents go by default.
#include <gtest/gtest.h>

#include "tests/extension/OperationsFixture.h"
#include "vellum/VLEntitlements.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

struct DefaultContainer : OperationsFixture {
  DefaultContainer() {
    framework.bundles.apps["editor"] = {{VLSkeinContainerIdentifiersEntitlement, {"one", "two"}},
                                        {"unasked", {"x"}}};
    framework.bundles.apps["game"] = {};
    framework.bundles.apps["com.tessel.Binder.viewer"] = {
        {VLUbiquityContainerIdentifiersEntitlement, {"ubiquitous"}}};
  }
  Lines ask(std::optional<std::string> bundleIdentifier) {
    host._defaultApplicationContainerForBundleIdentifier(std::move(bundleIdentifier), answer());
    return take();
  }
};

TEST_F(DefaultContainer, TheFilesAppGetsTheDocumentsFolder) {
  const NSURLPtr documents = storeURL("/Documents");
  framework.queryItems.items["/store/Documents"] = makeItem(3, false, "Documents");
  const std::string root = NSFileProviderRootContainerItemIdentifier;
  struct Case {
    std::optional<std::string> app;
    std::string outer, inner;
  };
  for (const auto& [app, outer, inner] :
       {Case{std::nullopt, "1", "3"}, Case{"com.tessel.Binder", "9", "b"}}) {
    Lines lines = ask(app);
    std::erase(lines, "containers: table");  // the root's URL, found once
    EXPECT_EQ(lines, (Lines{"[DEBUG] ┏" + outer + " lookup for default location of " +
                                app.value_or("(null)"),
                            "[DEBUG] creating default Documents folder",
                            "[DEBUG] ┏" + inner + " creating directory Documents under " + root,
                            "files: create \"Documents\" under file:///store",
                            "[DEBUG] ┗" + inner + " ", "[DEBUG] ┗" + outer + " "}));
    EXPECT_EQ(finish(nullptr, fileExists(documents)).back(),
              "answer: no item, NSFileProviderErrorDomain -1001 with Documents");
  }
}

TEST_F(DefaultContainer, AnAppGetsItsFirstContainer) {
  EXPECT_EQ(ask("editor"),
            (Lines{"[DEBUG] ┏1 lookup for default location of editor", "apps: editor",
                   "daemon: url of container one, recreated", "[DEBUG] ┗1 "}));
  auto& urls = framework.daemon.containerURLs;
  urls.next()->reply(storeURL("/f/new"), std::nullopt, true, nullptr);
  EXPECT_EQ(take(), (Lines{"items: ask file:///store/f/new", "answer: new, no error"}));

  ask("editor");
  urls.next()->reply(nullptr, "One", false, nullptr);
  EXPECT_EQ(take(), Lines{"answer: no item, NSFileProviderErrorDomain -1005"});
  ask("editor");
  urls.next()->reply(storeURL("/f/new"), "One", false, cocoa(4354));
  EXPECT_EQ(
      take(),
      Lines{"answer: no item, NSFileProviderErrorDomain -1003 under NSCocoaErrorDomain 4354"});
  ask("editor");
  const std::weak_ptr<VLFileProviderExtension> weak = extension;
  extension.reset();
  EXPECT_FALSE(weak.expired());
  framework.dropConnection(cocoa(4355));
  EXPECT_EQ(
      take(),
      Lines{"answer: no item, NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355"});
  EXPECT_TRUE(weak.expired());
}

TEST_F(DefaultContainer, EveryKindOfEntitlementIsReadAndTheFilesAppIsKnownByItsWholeName) {
  EXPECT_EQ(ask("com.tessel.Binder.viewer").at(2),
            "daemon: url of container ubiquitous, recreated");
  framework.daemon.containerURLs.next()->reply(nullptr, std::nullopt, false, nullptr);
  take();
}

TEST_F(DefaultContainer, AnUnknownAppAndOneWithoutContainersAreRefused) {
  EXPECT_EQ(
      ask("com.tessel.binder"),
      (Lines{"[DEBUG] ┏1 lookup for default location of com.tessel.binder",
             "apps: com.tessel.binder", "[ERROR] can't find bundle with id 'com.tessel.binder'",
             "answer: no item, VLVellumErrorDomain 15", "[DEBUG] ┗1 "}));
  EXPECT_EQ(
      lastError->localizedDescription(),
      vlc_errorInvalidParameter("bundleIdentifier", "com.tessel.binder")->localizedDescription());
  EXPECT_EQ(ask("game"), (Lines{"[DEBUG] ┏3 lookup for default location of game", "apps: game",
                                "[DEBUG] bundle 'game' is not entitled to used Skein Drive",
                                "answer: no item, VLVellumErrorDomain 1", "[DEBUG] ┗3 "}));
  EXPECT_TRUE(lastError->userInfo().empty());
}

TEST_F(DefaultContainer, EntitlementsListContainersOnceAndInOrder) {
  const auto listed = [](LSBundleProxy::EntitlementValues values) {
    return VLEntitledContainerIdentifiers(values);
  };
  const Lines services = {"Other", VLSkeinServiceDocuments};
  const Lines own = {"app"};
  EXPECT_EQ(listed({{VLUbiquityContainerIdentifiersEntitlement, {"c", "a"}},
                    {VLSkeinContainerIdentifiersEntitlement, {"b", "", "a", "b"}},
                    {VLApplicationIdentifierEntitlement, own}}),
            (Lines{"b", "a", "c"}));
  EXPECT_EQ(
      listed({{VLSkeinServicesEntitlement, services}, {VLApplicationIdentifierEntitlement, own}}),
      own);
  EXPECT_EQ(listed({{VLApplicationIdentifierEntitlement, own}}), Lines{});
  EXPECT_EQ(listed({{VLSkeinServicesEntitlement, {"Other"}},
                    {VLSkeinContainerIdentifiersEntitlement, {"b"}}}),
            Lines{});
}

}  // namespace
}  // namespace skein
