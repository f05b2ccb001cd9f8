// The desktop's cache: entries as file managers look for them, and gone when they are wrong.
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "linux/vald/thumbnails/DesktopThumbnails.h"
#include "linux/vald/thumbnails/PngText.h"
#include "tests/vald_thumbnails/RenderRig.h"

namespace skein::vald {
namespace {

class DesktopTest : public testing::Test {
 protected:
  DesktopTest() {
    start();
    record.modified = NSDate(std::chrono::milliseconds(1'700'000'000'900));
    record.contents.size = 4711;
  }
  void start() {
    desktop = std::make_unique<DesktopThumbnails>((folder.path() / "cache/thumbnails").string(),
                                                  *rig.renderer, rig.pool, rig.log);
  }
  // Waits for what was asked for: one after the other, so a last answer ends it.
  std::string pictureOf(int width, int height) {
    const std::string path = (folder.path() / "asset.jpg").string();
    std::ofstream(path, std::ios::binary) << samples::picture(PictureKind::Jpeg, width, height);
    return path;
  }
  bool appears(const std::string& size) {
    return becomesTrue([&] { return std::filesystem::exists(entry(size)); });
  }
  bool vanishes(const std::string& size) {
    return becomesTrue([&] { return !std::filesystem::exists(entry(size)); });
  }
  std::string entry(const std::string& size) const { return desktop->entryPath(size, url); }

  const std::string path = "/home/me/Drive/Été 100%.jpg";
  const std::string url = "file:///home/me/Drive/%C3%89t%C3%A9%20100%25.jpg";
  TemporaryFolder folder;
  RenderRig rig;
  CloudRecord record;
  std::unique_ptr<DesktopThumbnails> desktop;
};

TEST_F(DesktopTest, AnEvictedDocumentHasEntriesThatFileManagersFind) {
  record.thumbnail = pictureOf(1024, 683);
  desktop->documentWasEvicted(path, record);
  ASSERT_TRUE(appears("xx-large"));
  for (const auto& [size, side] :
       std::map<std::string, unsigned>{{"normal", 128}, {"large", 256}, {"x-large", 512}}) {
    SCOPED_TRACE(size);
    const std::string bytes = contentsOf(entry(size));
    EXPECT_EQ(pngText(bytes, "Thumb::URI"), url);
    EXPECT_EQ(pngText(bytes, "Thumb::MTime"), "1700000000");
    EXPECT_EQ(pngText(bytes, "Thumb::Size"), "4711");
    struct stat status {};
    ASSERT_EQ(stat(entry(size).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0600u);
    // Decoders check every part's checksum.
    rig.ask(PictureKind::Png, bytes);
    EXPECT_EQ(rig.answer(), "none");
    EXPECT_EQ(static_cast<unsigned char>(bytes[18]) << 8 | static_cast<unsigned char>(bytes[19]),
              side);
  }
  // The name is the MD5 of the URL, as the desktop's rules have it.
  EXPECT_EQ(
      desktop->entryPath("normal", "file:///home/jens/photos/me.png"),
      (folder.path() / "cache/thumbnails/normal/c6ee772d9e49320e97ec29a7eb5b1697.png").string());

  desktop->documentCameBack(path);
  EXPECT_TRUE(vanishes("xx-large"));
  EXPECT_FALSE(std::filesystem::exists(entry("normal")));
}

TEST_F(DesktopTest, SmallPicturesAreNotEnlargedAndOldEntriesGoWithTheThumbnail) {
  record.thumbnail = pictureOf(200, 100);
  desktop->documentWasEvicted(path, record);
  ASSERT_TRUE(appears("large"));
  record.thumbnail.reset();
  desktop->documentWasEvicted(path, record);
  ASSERT_TRUE(vanishes("large"));
  EXPECT_FALSE(std::filesystem::exists(entry("normal")));
  EXPECT_FALSE(std::filesystem::exists(folder.path() / "cache/thumbnails/x-large"));
}

TEST_F(DesktopTest, EntriesOfOthersStayAndAMissingPictureIsNoEntry) {
  std::filesystem::create_directories(folder.path() / "cache/thumbnails/normal");
  const std::string others = pngWithTexts(samples::picture(PictureKind::Png), {{"Software", "X"}});
  std::ofstream(entry("normal"), std::ios::binary) << others;
  desktop->documentCameBack(path);
  record.thumbnail = (folder.path() / "gone.jpg").string();
  desktop->documentWasEvicted(path, record);
  desktop->documentCameBack("/another");
  // Its destructor waits for what has begun; what follows begins after that.
  record.thumbnail = pictureOf(90, 90);
  desktop->documentWasEvicted("/last", record);
  EXPECT_TRUE(becomesTrue(
      [&] { return std::filesystem::exists(desktop->entryPath("normal", "file:///last")); }));
  EXPECT_EQ(contentsOf(entry("normal")), others);
  EXPECT_EQ(pngWithTexts("no PNG", {{"Software", "X"}}), "");
  EXPECT_FALSE(pngText(others.substr(0, 40), "Software"));
}

}  // namespace
}  // namespace skein::vald
