// Thumbnails of containers' folders.
#include <gtest/gtest.h>

#include "support/NSString+PortfolioAdditions.h"
#include "tests/thumbnails/ThumbnailFixture.h"
#include "thumbnails/ContainerThumbnails.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

struct ContainerIcons : ThumbnailFixture {
  ContainerIcons() {
    add("plain", NSData("icon"), false);
    add("app", NSData("icon"), true);
    add("bare", std::nullopt, true);
    framework.documents.containerIDs["/store/gone"] = "gone";
    env.run();
  }
  // A container with its folder i1, i2, ... at /store/NAME.
  void add(const std::string& name, std::optional<NSData> image, bool isAppIcon) {
    framework.containers.table[name] =
        std::make_shared<IconContainer>(name, std::move(image), isAppIcon, env.transcript);
    framework.documents.containerIDs["/store/" + name] = name;
  }
  std::string folder(std::uint64_t number, const std::string& name) {
    const auto id = VLFileObjectID::folderOrAliasWithRawID(number);
    framework.documents.urls[id] = storeURL("/" + name);
    return id.asString();
  }
  const ContainerThumbnails icons{env.log};
};

TEST_F(ContainerIcons, SizesAreCutToASquareOfAtMost120) {
  const auto proper = [&](NSSize size) { return icons._properSizeForContainerThumbnail(size); };
  EXPECT_EQ(proper({200, 80}), (NSSize{80, 80}));
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] width (200.00) is greater than max width (120.00)",
                              "[DEBUG] width (120.00) and height (80.00) should be equal for "
                              "container's thumbnail"}));
  EXPECT_EQ(proper({500, 500}), (NSSize{120, 120}));
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] width (500.00) is greater than max width (120.00)",
                              "[DEBUG] height (500.00) is greater than max height (120.00)"}));
  EXPECT_EQ(proper({60.5, 120.25}), (NSSize{60.5, 60.5}));
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] height (120.25) is greater than max height (120.00)",
                              "[DEBUG] width (60.50) and height (120.00) should be equal for "
                              "container's thumbnail"}));
  for (const double side : {120.0, 60.0, 0.0}) {
    EXPECT_EQ(proper({side, side}), (NSSize{side, side}));
  }
  EXPECT_EQ(env.run(), Lines{});
  EXPECT_EQ(vl_stringWithSize({1, 2.345}), "{1.00, 2.35}");
  // Nothing is cut: 60 digits before each point.
  EXPECT_EQ(vl_stringWithSize({1e60, 1e60}).size(), 130u);
}

TEST_F(ContainerIcons, AnIconAndWhetherItIsAnAppsOrWhyThereIsNone) {
  const auto ask = [&](const std::string& containerID, bool handled = true) {
    icons._fetchThumbnailForContainerID(
        containerID, "i7", {64, 64}, framework.containers.table,
        handled ? perThumbnail() : NSFileProviderExtension::ThumbnailWithTypeHandler());
    return env.run();
  };
  EXPECT_EQ(ask("plain"),
            (Lines{"icon of plain at 64x64", "thumbnail of i7: \"icon\", no type, no error"}));
  EXPECT_EQ(ask("app"),
            (Lines{"icon of app at 64x64",
                   "thumbnail of i7: \"icon\", com.tessel.fileprovider.vl-undecorated-container, "
                   "no error"}));
  const Lines bare = {"icon of bare at 64x64",
                      "[ERROR] can't find image with size {64.00, 64.00} for bare"};
  EXPECT_EQ(ask("bare", false), bare);
  EXPECT_EQ(ask("bare"),
            (Lines{bare[0], bare[1], "thumbnail of i7: no data, no type, VLVellumErrorDomain 15"}));
  NSErrorPtr noImage;
  icons._fetchThumbnailForContainerID(
      "bare", "i7", {64, 64}, framework.containers.table,
      [&](auto&, auto&&, auto&&, const NSErrorPtr& error) { noImage = error; });
  ASSERT_TRUE(noImage);
  EXPECT_EQ(noImage->localizedDescription(),
            vlc_errorInvalidParameter("size", "{64.00, 64.00}")->localizedDescription());
  env.run();
  EXPECT_EQ(ask("gone", false), Lines{"[ERROR] can't find container with ID gone"});
  // The error is the item's, not the container's.
  NSErrorPtr missing;
  icons._fetchThumbnailForContainerID(
      "gone", "i7", {64, 64}, {},
      [&](auto&, auto&&, auto&&, const NSErrorPtr& error) { missing = error; });
  ASSERT_EQ(brief(missing), "NSFileProviderErrorDomain -1005");
  EXPECT_EQ(std::get<std::string>(
                missing->userInfo().at(NSFileProviderErrorNonExistentItemIdentifierKey)),
            "i7");
}

TEST_F(ContainerIcons, ABatchAsksForTheTableOnceAndForDocumentsAndDesktopToo) {
  add(VLUbiquitousDocumentsContainerID, NSData("icon"), false);
  const std::string documents = folder(1, VLUbiquitousDocumentsContainerID);
  const std::string app = folder(2, "app");
  const std::string gone = folder(3, "gone");
  fetch({documents, app, gone}, {300, 300});
  EXPECT_EQ(takeCalls(),
            (Lines{"containers: table", "icon of com.tessel.Skein.Documents at 120x120",
                   "thumbnail of " + documents + ": \"icon\", no type, no error",
                   "icon of app at 120x120",
                   "thumbnail of " + app +
                       ": \"icon\", com.tessel.fileprovider.vl-undecorated-container, no error",
                   "thumbnail of " + gone + ": no data, no type, NSFileProviderErrorDomain -1005",
                   "completed: no error"}));
}

TEST_F(ContainerIcons, ThreeArgumentsCarryTheTypeWhereAnErrorIsLookedFor) {
  const std::string app = folder(1, "app");
  const std::string bare = folder(2, "bare");
  const auto third = [](const std::variant<std::monostate, NSErrorPtr, std::string>& value) {
    const auto* type = std::get_if<std::string>(&value);
    return type != nullptr ? *type : value.index() == 0 ? "nothing" : "an error";
  };
  host.fetchThumbnailsForItemIdentifiers(
      {app, bare, "unknown", "i00000000000000ff"}, {64, 64},
      [&](const std::string& identifier, const std::optional<NSData>& data, const auto& value) {
        env.transcript.add(identifier + ": " + say(data) + ", " + third(value));
      },
      completion());
  EXPECT_EQ(
      takeCalls(),
      (Lines{"containers: table", "icon of app at 64x64",
             app + ": \"icon\", com.tessel.fileprovider.vl-undecorated-container",
             "icon of bare at 64x64", bare + ": no data, nothing", "unknown: no data, nothing",
             "i00000000000000ff: no data, nothing", "completed: no error"}));
  host.fetchThumbnailsForItemIdentifiers({app}, {64, 64}, nullptr, nullptr);
  EXPECT_EQ(takeCalls(), (Lines{"containers: table", "icon of app at 64x64"}));
}

}  // namespace
}  // namespace skein
