// From an upload to the record's thumbnail, through crashes, failures and revisions.
#include <filesystem>
#include <fstream>

#include "linux/vald/thumbnails/ThumbnailService.h"
#include "tests/vald_thumbnails/RenderRig.h"

namespace skein::vald {
namespace {

class MakerTest : public testing::Test {
 protected:
  MakerTest() { open(); }

  void open() {
    maker.reset();
    auto opened = ThumbnailAssets::open((folder.path() / "thumbnails").string(), files);
    EXPECT_EQ(failureOf(opened.error()), "none");
    assets = std::move(*opened);
    maker = std::make_unique<ThumbnailMaker>(
        ThumbnailServices{*cloud.contents, *cloud.records, *assets, *rig.renderer, rig.log,
                          [this](VLFileObjectID document) { return typeOf(document); }},
        rig.pool, 3);
  }
  std::optional<std::string> typeOf(VLFileObjectID document) {
    MutexLock lock(mutex);
    const auto found = types.find(document);
    return found == types.end() ? std::nullopt : std::optional(found->second);
  }
  void upload(std::uint64_t number, const std::string& contents, const std::string& type) {
    {
      MutexLock lock(mutex);
      types[documentNumber(number)] = type;
    }
    const std::string path = cloud.write("document" + std::to_string(number), contents);
    ASSERT_TRUE(std::holds_alternative<UploadDone>(cloud.upload(documentNumber(number), path)));
  }
  std::optional<std::string> thumbnail(std::uint64_t number) {
    return (*cloud.records->record(documentNumber(number)))->thumbnail;
  }
  // Tells of the upload, and waits until the maker has nothing left to do.
  void make(std::initializer_list<std::uint64_t> numbers) {
    for (const std::uint64_t number : numbers) maker->documentWasUploaded(documentNumber(number));
    ASSERT_TRUE(maker->waitUntilIdle(testDeadline()));
  }
  std::vector<std::string> filesIn(const std::string& name) const {
    std::vector<std::string> found;
    for (const auto& entry :
         std::filesystem::recursive_directory_iterator(folder.path() / "thumbnails" / name)) {
      if (entry.is_regular_file()) found.push_back(entry.path().string());
    }
    return found;
  }

  TemporaryFolder folder;
  CloudRig cloud{folder.path()};
  RenderRig rig;
  FaultyFileLayer files;
  Mutex mutex;
  std::map<VLFileObjectID, std::string> types SKEIN_GUARDED_BY(mutex);
  std::unique_ptr<ThumbnailAssets> assets;
  std::unique_ptr<ThumbnailMaker> maker;
};

TEST_F(MakerTest, EachContentsHaveOnePictureAndANewRevisionANewOne) {
  const std::string picture = samples::picture(PictureKind::Jpeg, 1500, 1000);
  upload(1, picture, "image/jpeg");
  upload(2, picture, "image/jpeg");
  upload(3, "no picture", "application/zip");
  upload(4, "Words.\n", "text/x-notes");
  make({1, 2, 3, 4});
  ASSERT_TRUE(thumbnail(1));
  EXPECT_TRUE(contentsOf(*thumbnail(1)).starts_with("\xff\xd8"));
  EXPECT_EQ(thumbnail(2), thumbnail(1));
  EXPECT_FALSE(thumbnail(3));
  EXPECT_TRUE(thumbnail(4));
  EXPECT_EQ(filesIn("pictures").size(), 2u);
  EXPECT_EQ(filesIn("incoming").size(), 0u);

  upload(1, samples::picture(PictureKind::Jpeg, 40, 30), "image/jpeg");
  EXPECT_FALSE(thumbnail(1));
  make({1});
  ASSERT_TRUE(thumbnail(1));
  EXPECT_NE(thumbnail(1), thumbnail(2));

  // The picture of contents that nobody has any more goes with them.
  upload(2, "Words.\n", "text/plain");
  const auto removed = assets->collectGarbage(
      [this](const ContentHash& hash) { return *cloud.records->references(hash) > 0; });
  EXPECT_EQ(*removed, 1u);
  EXPECT_TRUE(std::filesystem::exists(*thumbnail(1)));
  EXPECT_TRUE(std::filesystem::exists(*thumbnail(4)));
}

TEST_F(MakerTest, WhatCannotBeDrawnIsNotTriedAgainForTheSameContents) {
  upload(1, "this is no JPEG", "image/jpeg");
  make({1});
  EXPECT_FALSE(thumbnail(1));
  const std::size_t before = filesIn("pictures").size();
  EXPECT_EQ(before, 1u);

  // Whoever tried would need a worker, and would find the renderer gone.
  rig.clock.advance(rig.limits.idle);
  ASSERT_TRUE(becomesTrue([&] {
    rig.clock.advance(rig.limits.idle);
    return rig.renderer->workers() == 0;
  }));
  open();
  make({1});
  EXPECT_EQ(rig.renderer->workers(), 0u);
  // As something else it may well be one.
  upload(1, "this is no JPEG", "text/plain");
  make({1});
  EXPECT_TRUE(thumbnail(1));
}

TEST_F(MakerTest, AMachineThatCannotDrawSaysNothingAboutTheDocument) {
  auto options = RenderRig::withLimit(1);
  options.worker.program = "/nowhere";
  RenderRig broken(options);
  upload(1, samples::picture(PictureKind::Png), "image/png");
  {
    ThumbnailMaker helpless({*cloud.contents, *cloud.records, *assets, *broken.renderer, rig.log,
                             [this](VLFileObjectID document) { return typeOf(document); }},
                            rig.pool, 1);
    helpless.documentWasUploaded(documentNumber(1));
    ASSERT_TRUE(helpless.waitUntilIdle(testDeadline()));
  }
  EXPECT_EQ(filesIn("pictures").size(), 0u);
  make({1});
  EXPECT_TRUE(thumbnail(1));
}

TEST_F(MakerTest, WhatAnEarlierProcessLeftUndoneIsMadeAtTheStart) {
  const std::string picture = samples::picture(PictureKind::Gif);
  for (std::uint64_t number = 1; number <= 230; ++number) {
    upload(number, number % 2 == 0 ? picture : "zip", number % 2 == 0 ? "image/gif" : "x/zip");
  }
  maker->makeMissing();
  ASSERT_TRUE(maker->waitUntilIdle(testDeadline()));
  for (std::uint64_t number = 1; number <= 230; ++number) {
    ASSERT_EQ(thumbnail(number).has_value(), number % 2 == 0) << number;
  }
}

TEST_F(MakerTest, APictureIsThereWholeOrNotAtAll) {
  upload(1, samples::picture(PictureKind::Png), "image/png");
  for (std::uint64_t step = 1;; ++step) {
    SCOPED_TRACE(step);
    files.failAt(0, 0);
    std::filesystem::remove_all(folder.path() / "thumbnails");
    open();
    files.failAt(step, ENOSPC);
    make({1});
    if (!files.met()) break;
    EXPECT_FALSE(thumbnail(1));
    EXPECT_EQ(filesIn("pictures").size(), 0u);
    EXPECT_EQ(filesIn("incoming").size(), 0u);
    ASSERT_LT(step, 20u);
  }
  EXPECT_TRUE(thumbnail(1));
  files.failAt(0, 0);
  // A crash leaves at most what the next opening removes.
  std::ofstream(folder.path() / "thumbnails/incoming/7") << "half a pict";
  open();
  EXPECT_EQ(filesIn("incoming").size(), 0u);
}

TEST_F(MakerTest, TheServiceEndsInTheMiddleOfItsWork) {
  auto started = ThumbnailService::start(
      {*cloud.contents, *cloud.records, files, rig.clock, rig.log,
       (folder.path() / "service").string(), (folder.path() / "desktop").string(),
       [](VLFileObjectID) { return "application/pdf"; }, RenderRig::withLimit(1)});
  ASSERT_EQ(failureOf(started.error()), "none");
  for (std::uint64_t number = 1; number <= 4; ++number) {
    upload(number, samples::slowPdf(9) + std::to_string(number), "application/pdf");
    (*started)->documentWasUploaded(documentNumber(number));
  }
  started->reset();
  for (std::uint64_t number = 1; number <= 4; ++number) EXPECT_FALSE(thumbnail(number));
  EXPECT_TRUE(std::filesystem::is_empty(folder.path() / "service/pictures"));
}

}  // namespace
}  // namespace skein::vald
