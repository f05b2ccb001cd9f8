// Documents on their way up: when, again, not, and why not.
#include <fcntl.h>
#include <sys/stat.h>

#include <map>

#include "linux/vald/cloud/CloudErrors.h"
#include "tests/support/ManualExecutor.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

using Phase = UploadState::Phase;
using std::chrono::milliseconds;
using std::chrono::seconds;

const VLFileObjectID kOne = documentNumber(1);
const VLFileObjectID kTwo = documentNumber(2);

class UploadTest : public testing::Test, public UploadListener {
 protected:
  void uploadStateDidChange(VLFileObjectID document, const UploadState& state) override {
    static constexpr char kLetters[] = "wUuF";
    told[document] += kLetters[static_cast<int>(state.phase)];
    if (state.phase == Phase::Uploading && whileUploading) whileUploading();
  }
  // Time passes and all that is due runs.
  void pass(CloudClock::Duration duration) {
    rig.clock.advance(duration);
    executor->runAll();
  }
  std::string state(VLFileObjectID document) {
    const auto state = *uploader->state(document);
    if (!state) return "unknown";
    static constexpr const char* kWords[] = {"waiting", "uploading", "uploaded", "failed"};
    const std::string word = kWords[static_cast<int>(state->phase)];
    return state->error == nullptr ? word : word + " " + std::to_string(state->error->code());
  }
  std::string cloudHas(VLFileObjectID document) {
    const auto record = *rig.records->record(document);
    if (!record) return "nothing";
    const auto file = rig.contents->read(record->contents.hash);
    std::string text(record->contents.size, ' ');
    return pread(file->get(), text.data(), text.size(), 0) < 0 ? "unreadable" : text;
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
  std::shared_ptr<ManualExecutor> executor = std::make_shared<ManualExecutor>();
  std::map<VLFileObjectID, std::string> told;
  std::function<void()> whileUploading;
  std::unique_ptr<Uploader> uploader =
      std::make_unique<Uploader>(rig.uploads(), *this, executor, Uploader::Options{});
};

TEST_F(UploadTest, ADocumentGoesUpWhenItHasSettled) {
  const std::string path = rig.write("a", "one");
  EXPECT_EQ(state(kOne), "unknown");
  uploader->documentDidChange(kOne, path);
  pass(milliseconds(1500));
  rig.write("a", "two");
  uploader->documentDidChange(kOne, path);
  pass(milliseconds(1500));
  EXPECT_EQ(state(kOne), "waiting");
  EXPECT_EQ(told[kOne], "");
  pass(milliseconds(600));
  EXPECT_EQ(state(kOne), "uploaded");
  EXPECT_EQ(told[kOne], "Uu");
  EXPECT_EQ(cloudHas(kOne), "two");
  struct stat status {};
  ASSERT_EQ(stat(path.c_str(), &status), 0);
  EXPECT_EQ((*uploader->state(kOne))->stamp, UploadStamp::of(status));

  // Nobody said that it changed, but its own times do.
  setTags(path, "red");
  Cancellation cancellation;
  const auto result = attemptUpload(rig.uploads(), kOne, path, std::chrono::hours(1), cancellation);
  ASSERT_TRUE(std::holds_alternative<UploadTooEarly>(result));
  EXPECT_LE(std::get<UploadTooEarly>(result).wait, std::chrono::hours(1));
  EXPECT_GT(std::get<UploadTooEarly>(result).wait, std::chrono::minutes(50));
  // The clock was put back: what lies far ahead changed long ago.
  rig.clock.advance(-std::chrono::hours(5));
  EXPECT_TRUE(std::holds_alternative<UploadDone>(
      attemptUpload(rig.uploads(), kOne, path, std::chrono::hours(1), cancellation)));
}

TEST_F(UploadTest, AChangeDuringTheUploadBeginsItAnew) {
  const std::string path = rig.write("a", "first contents");
  whileUploading = [&] {
    rig.write("a", "told of");
    uploader->documentDidChange(kOne, path);
  };
  uploader->documentDidChange(kOne, path);
  pass(seconds(2));
  EXPECT_EQ(state(kOne), "waiting");
  EXPECT_EQ(cloudHas(kOne), "nothing");
  whileUploading = nullptr;
  told.clear();
  pass(milliseconds(1999));
  EXPECT_TRUE(told.empty());
  pass(milliseconds(1));
  EXPECT_EQ(cloudHas(kOne), "told of");
}

TEST_F(UploadTest, AFileThatChangesUnderTheReaderIsNotTaken) {
  const std::string path = rig.write("a", "before");
  // Each of these happens while the contents are on their way.
  const std::vector<std::function<void()>> changes = {
      [&] { rig.write("a", "AFTER!"); },
      [&] { std::filesystem::rename(rig.write("b", "before"), path); },
      [&] { std::filesystem::remove(path); },
  };
  for (const auto& change : changes) {
    class ChangingClock final : public CloudClock {
     public:
      ChangingClock(CloudClock& clock, const std::function<void()>& change)
          : _clock(clock), _change(change) {}
      Duration now() override { return _clock.now(); }
      NSDate date() override { return _clock.date(); }
      void callAfter(Duration, Task task) override {
        _change();
        task();
      }

     private:
      CloudClock& _clock;
      const std::function<void()>& _change;
    } clock(rig.clock, change);
    rig.conditions.change([](auto& settings) { settings.delay = milliseconds(1); });
    UploadServices services{rig.roots,    rig.files,      *rig.contents,
                            *rig.records, rig.conditions, clock};
    Cancellation cancellation;
    const auto result = attemptUpload(services, kOne, path, {}, cancellation);
    EXPECT_TRUE(std::holds_alternative<UploadTooEarly>(result));
    EXPECT_EQ(cloudHas(kOne), "nothing");
  }
}

TEST_F(UploadTest, WhileOfflineOneIsTriedAtGrowingIntervals) {
  rig.conditions.change([](auto& settings) { settings.offline = true; });
  for (const auto& document : {kOne, kTwo}) {
    uploader->documentDidChange(document, rig.write(document.asString(), "text"));
  }
  pass(seconds(2));
  EXPECT_EQ(state(kOne), "waiting 4355");
  EXPECT_EQ(uploader->failures().size(), 2u);
  std::vector<int> tries;
  for (const int wait : {1, 2, 4, 8}) {
    told.clear();
    pass(seconds(wait) - milliseconds(1));
    EXPECT_TRUE(told.empty()) << wait;
    pass(milliseconds(1));
    EXPECT_EQ(told[kOne] + told[kTwo], "Uw") << wait;
  }
  rig.conditions.change([](auto& settings) { settings.offline = false; });
  told.clear();
  pass(seconds(15));
  EXPECT_TRUE(told.empty());
  uploader->retry();
  executor->runAll();
  EXPECT_EQ(state(kOne), "uploaded");
  EXPECT_EQ(state(kTwo), "uploaded");
  EXPECT_EQ(rig.records->usedBytes(), 8u);
}

TEST_F(UploadTest, AFullCloudIsTheDocumentsOwnFailure) {
  rig.conditions.change([](auto& settings) { settings.quota = 10; });
  uploader->documentDidChange(kOne, rig.write("large", "eleven bytes"));
  uploader->documentDidChange(kTwo, rig.write("small", "ten bytes."));
  pass(seconds(2));
  EXPECT_EQ(state(kOne), "failed 4354");
  EXPECT_EQ(state(kTwo), "uploaded");
  ASSERT_EQ(uploader->failures().size(), 1u);
  pass(seconds(1000));
  EXPECT_EQ(told[kOne], "UF");  // nothing changed: not tried again
  const NSErrorPtr error = rig.evict(kOne, (rig.top / "drive/large").string());
  EXPECT_EQ(error->code(), static_cast<int>(EvictionRefusal::NotUploaded));

  // Its own former contents make room for what it has now.
  uploader->documentDidChange(kTwo, rig.write("small", "TEN BYTES!"));
  pass(seconds(2));
  EXPECT_EQ(cloudHas(kTwo), "TEN BYTES!");
  EXPECT_EQ(rig.records->usedBytes(), 10u);
  rig.conditions.change([](auto& settings) { settings.quota = 100; });
  uploader->retry();
  executor->runAll();
  EXPECT_EQ(state(kOne), "uploaded");
}

TEST_F(UploadTest, FailuresOfTheCloudAreKeptAndARemovedDocumentIsForgotten) {
  rig.conditions.change([](auto& settings) {
    settings.failures = 1;
    settings.failure = corruptError("the upload");
  });
  const std::string path = rig.write("a", "text");
  uploader->documentDidChange(kOne, path);
  pass(seconds(2));
  EXPECT_EQ(state(kOne), "failed 259");
  EXPECT_TRUE(std::filesystem::is_empty(rig.top / "cloud/incoming"));
  whileUploading = [&] { EXPECT_EQ(brief(uploader->documentWasRemoved(kOne)), "none"); };
  uploader->retry();
  executor->runAll();
  EXPECT_EQ(state(kOne), "unknown");
  EXPECT_EQ(cloudHas(kOne), "nothing");
  whileUploading = nullptr;
  // Removed when nothing stops the upload any more: the record that it writes goes, too.
  rig.files.before = [&](FileStep step, std::string_view) {
    if (step == FileStep::Rename) uploader->documentWasRemoved(kOne);
  };
  uploader->documentDidChange(kOne, rig.write("a", "other text"));
  pass(seconds(2));
  rig.files.before = nullptr;
  EXPECT_EQ(state(kOne), "unknown");
  EXPECT_EQ(cloudHas(kOne), "nothing");
  uploader->documentDidChange(kTwo, path + "-missing");
  pass(seconds(2));
  EXPECT_EQ(state(kTwo), "failed 4");

  // It may go at any moment: what was posted does nothing any more.
  uploader->documentDidChange(kOne, path);
  rig.clock.advance(seconds(2));
  uploader.reset();
  executor->runAll();
  rig.clock.advance(seconds(100));
  EXPECT_EQ(cloudHas(kOne), "nothing");
}

}  // namespace
}  // namespace skein::vald
